#pragma once

// Which plug-ins the daemon offers to its worker.

#include "adminhostd/Options.h"
#include "adminhostd/Protocol.h"

#include <vector>

namespace adminhost {

struct PluginSelection {
    std::vector<DiskPath> files;
    std::vector<protocol::RefusedPlugin> refused;  ///< not trusted, or not readable
};

/// Selects the plug-ins that are named in the options (refused only if everybody may write to them), or else those of
/// the plug-in directory, which must be trusted as a whole.
[[nodiscard]] PluginSelection selectPlugins(const Options& options);

}  // namespace adminhost
