#pragma once

// The first message to every worker.

#include "adminhostd/Options.h"
#include "adminhostd/PluginSelection.h"
#include "adminhostd/Protocol.h"

#include <string>

namespace adminhost {

/// `toolConfiguration` is the directory in which tools look for their settings.
[[nodiscard]] protocol::Configure workerConfiguration(const Options& options, const PluginSelection& plugins,
                                                      const std::string& toolConfiguration);

}  // namespace adminhost
