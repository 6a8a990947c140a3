#pragma once

// Files that hold one secret, such as the value of a protected property.

#include "platform/value/Result.h"

#include <string>

namespace adminhost::ctl {

/// Returns the content of the file, without one line end at its end. Fails with the reason if the file cannot be read,
/// is not a regular file, can be accessed by the group or others, is empty or holds more than 64 KiB.
[[nodiscard]] Result<std::string> secretOfFile(const std::string& path);

}  // namespace adminhost::ctl
