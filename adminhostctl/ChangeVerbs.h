#pragma once

// The verbs that change the service's configuration, or write it down. Each is a row of the table in Verbs.cpp.

#include "adminhostctl/Verbs.h"

#include <span>
#include <string>

namespace adminhost::ctl {

[[nodiscard]] ExitStatus settingsGet(const Context& context, std::span<const std::string> arguments);
[[nodiscard]] ExitStatus settingsSet(const Context& context, std::span<const std::string> arguments);
[[nodiscard]] ExitStatus propertySet(const Context& context, std::span<const std::string> arguments);
[[nodiscard]] ExitStatus propertyRemove(const Context& context, std::span<const std::string> arguments);
[[nodiscard]] ExitStatus cameraAllow(const Context& context, std::span<const std::string> arguments);
[[nodiscard]] ExitStatus cameraDeny(const Context& context, std::span<const std::string> arguments);
[[nodiscard]] ExitStatus cameraAccess(const Context& context, std::span<const std::string> arguments);
[[nodiscard]] ExitStatus cameraRemove(const Context& context, std::span<const std::string> arguments);
[[nodiscard]] ExitStatus exportState(const Context& context, std::span<const std::string> arguments);
[[nodiscard]] ExitStatus planFile(const Context& context, std::span<const std::string> arguments);
[[nodiscard]] ExitStatus applyFile(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
