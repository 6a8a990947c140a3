#pragma once

// What the file system knows about a path: free space and creation dates. Links are followed.

#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <optional>

namespace adminhost {

/// Free bytes that an ordinary account can have on the file system that holds the path; what is reserved for the
/// superuser does not count. Returns nullopt if the file system cannot be examined.
[[nodiscard]] ADMINHOST_EXPORT std::optional<std::uint64_t> freeSpaceOf(const DiskPath& path) noexcept;

/// When the file was created; where the file system does not keep that, when it was last modified. Returns nullopt if
/// the file cannot be examined.
[[nodiscard]] ADMINHOST_EXPORT std::optional<Date> creationDateOf(const DiskPath& path) noexcept;

/// Returns true if the path names a directory.
[[nodiscard]] ADMINHOST_EXPORT bool isDirectory(const DiskPath& path) noexcept;

}  // namespace adminhost
