#pragma once

// Which plug-ins the daemon offers to its worker.

#include "adminhostd/Options.h"
#include "adminhostd/Protocol.h"

#include <vector>

namespace adminhost {

struct PluginSelection {
    std::vector<DiskPath> files;
    std::vector<protocol::RefusedPlugin> refused;  ///< not trustworthy, or not readable
};

/// Selects the plug-ins that are named in the options (refused only when everybody may write them), or else those of
/// the plug-in directory, which must be trustworthy as a whole.
[[nodiscard]] PluginSelection selectPlugins(const Options& options);

}  // namespace adminhost
