#pragma once

// The two ways to find out whether a service is running; see ServiceState.h. For this room only.

#include "platform/value/Result.h"

#include <string>

namespace adminhost {

[[nodiscard]] Result<bool> unitIsRunning(const std::string& unit);
[[nodiscard]] Result<bool> pidFileNamesRunningProcess(const std::string& unit);

}  // namespace adminhost
