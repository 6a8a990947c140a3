#pragma once

// Whole files, read with bounds.

#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"

#include <cstddef>
#include <string>

namespace adminhost {

/// The bytes of a regular file (a link to one is followed). Fails if it cannot be read, is not a regular file (a pipe
/// is never waited for) or is larger than the maximum in bytes: domain "posix", the system's error number, a
/// description that names the host path.
[[nodiscard]] ADMINHOST_EXPORT Result<std::string> readFile(const DiskPath& path, std::size_t maximum);

}  // namespace adminhost
