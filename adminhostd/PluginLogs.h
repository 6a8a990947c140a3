#pragma once

// The log files that the plug-ins name, as clients read them.

#include "adminhostd/PluginFile.h"
#include "adminhostd/Protocol.h"

#include <vector>

namespace adminhost {

/// The names and sizes of all logs, or a piece of one of them.
[[nodiscard]] protocol::Answer logAnswer(const std::vector<LoadedPlugin>& plugins, const protocol::ReadLog& order);

}  // namespace adminhost
