#pragma once

// Whether the daemon that looks names up on the local network is running.

#include "platform/framework/Export.h"

#include <chrono>
#include <optional>
#include <string>

namespace adminhost {

/// Asks Avahi for its state, for at most this time; never starts it. Returns why names cannot be looked up; nullopt if
/// they can.
[[nodiscard]] ADMINHOST_EXPORT std::optional<std::string> avahiProblem(std::chrono::milliseconds limit);

}  // namespace adminhost
