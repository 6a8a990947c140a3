#pragma once

// The bound on what is captured of one stream of a tool. A variable only so that tests need no 256 MiB.

#include <cstddef>

namespace adminhost {

constexpr std::size_t taskDefaultOutputBound = std::size_t{256} << 20U;  ///< bytes

/// Sets the bound for tools launched from now on, in bytes.
void setTaskOutputBound(std::size_t bytes) noexcept;

}  // namespace adminhost
