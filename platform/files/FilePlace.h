#pragma once

// Opening the directory of a file that is about to be changed with the privileges of this process.

#include "platform/files/FileDescriptor.h"
#include "platform/files/Path.h"
#include "platform/framework/Export.h"

#include <optional>
#include <string>
#include <vector>

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

/// One step of a path: a directory, and its entry that the path goes through.
struct ADMINHOST_EXPORT PathStep {
    struct stat directory {};
    struct stat entry {};
};

/// Where a path leads, after all links.
struct ADMINHOST_EXPORT FileRoute {
    FileDescriptor directory;  ///< the file's directory, or the last one on the way that exists; only names it (O_PATH)
    struct stat directoryStatus {};
    std::optional<struct stat> file;  ///< the file's attributes, if it exists
    bool missesDirectory = false;     ///< the file's directory does not exist either
    std::vector<PathStep> steps;      ///< those that exist, in their order, with those of links
};

/// Follows a path to its end, or to its first part that does not exist. Returns the system's error number, 0 for
/// success. Unlike openPlace() it follows every link: its caller decides who may have created them.
[[nodiscard]] ADMINHOST_EXPORT int openRoute(const DiskPath& path, FileRoute& route);

}  // namespace adminhost
