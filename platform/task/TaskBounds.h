#pragma once

// What applies to every tool that this process runs. The functions of Task.h set it, except the bound, which only tests
// change: they need no 256 MiB.

#include "platform/framework/Export.h"

#include <chrono>
#include <cstddef>
#include <cstdint>

namespace adminhost {

constexpr std::size_t taskDefaultOutputBound = std::size_t{256} << 20U;  ///< bytes

/// Sets the bound for task groups made from now on, in bytes.
ADMINHOST_EXPORT void setTaskOutputBound(std::size_t bytes) noexcept;

[[nodiscard]] ADMINHOST_EXPORT std::size_t taskOutputBound() noexcept;
/// How many tools this process has started. Those that were refused or could not be started do not count.
[[nodiscard]] ADMINHOST_EXPORT std::uint64_t startedTasks() noexcept;
[[nodiscard]] ADMINHOST_EXPORT std::chrono::steady_clock::time_point taskDeadline() noexcept;  ///< the maximum for none

}  // namespace adminhost
