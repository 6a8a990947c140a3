#pragma once

// Whole files, read with bounds.

#include "platform/files/Path.h"
#include "platform/value/Error.h"

#include <cstddef>
#include <optional>
#include <string>

namespace adminhost {

/// The bytes of a regular file (a link to one is followed). Nothing if it cannot be read, is no regular file (a pipe
/// is never waited for) or is larger than the maximum in bytes; then, if error is given, it has the domain "posix",
/// the system's error number and a description that names the host path.
[[nodiscard]] std::optional<std::string> readFile(const DiskPath& path, std::size_t maximum, Error* error = nullptr);

}  // namespace adminhost
