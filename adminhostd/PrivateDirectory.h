#pragma once

// Private directories of a running daemon, and the removal of those that a killed one has left.

#include "platform/files/FileDescriptor.h"

#include <string>

namespace adminhost {

/// Creates a directory of mode 0700 and an unpredictable name in the parent, and stores its path. As long as the
/// descriptor, or one of holdDirectory(), is open, removeAbandonedDirectories() leaves the directory alone. Throws
/// std::system_error.
[[nodiscard]] FileDescriptor createPrivateDirectory(const std::string& parent, std::string& path);

/// As above, for another process that uses the directory. Returns an empty descriptor if it does not exist.
[[nodiscard]] FileDescriptor holdDirectory(const std::string& path);

/// Removes the private directories in the parent that no process holds.
void removeAbandonedDirectories(const std::string& parent) noexcept;

}  // namespace adminhost
