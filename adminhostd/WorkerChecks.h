#pragma once

// The host's checks of the installation that wait for other programs. So the worker makes them, and not the front.

#include "adminhostd/PluginFile.h"
#include "platform/framework/Plugin.h"

#include <vector>

namespace adminhost {

/// The system's services that the host and its plug-ins use.
[[nodiscard]] std::vector<Diagnosis> workerChecks();

/// The checks of one plug-in, each with the plug-in's name before its own. A plug-in that throws is one failed check.
[[nodiscard]] std::vector<Diagnosis> checksOf(const LoadedPlugin& loaded);

}  // namespace adminhost
