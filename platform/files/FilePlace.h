#pragma once

// Opening the directory of a file that is about to be changed with the privileges of this process.

#include "platform/files/FileDescriptor.h"
#include "platform/files/Path.h"
#include "platform/framework/Export.h"

#include <string>

#include <sys/stat.h>

namespace adminhost {

/// A file's directory, open for reading, and its name in it.
struct ADMINHOST_EXPORT FilePlace {
    FileDescriptor directory;
    std::string name;
};

/// Returns true if others than root and this process's user may create entries in the directory.
[[nodiscard]] ADMINHOST_EXPORT bool othersMayWrite(const struct stat& directory) noexcept;

/// Finds the place of a file, which need not exist. Links on the way are followed only where nobody but root and this
/// process's own user can have created them: a link in a directory that others may write to is ELOOP. Returns the
/// system's error number, 0 for success; a path that does not end in a name ("/", "a/", "a/..") is EINVAL.
[[nodiscard]] ADMINHOST_EXPORT int openPlace(const DiskPath& path, FilePlace& place);

}  // namespace adminhost
