#pragma once

// Making directories and empty files.

#include "platform/files/Path.h"
#include "platform/value/Error.h"

#include <optional>

#include <sys/types.h>

namespace adminhost {

struct DirectoryAttributes {
    uid_t owner = 0;
    gid_t group = 0;
    mode_t mode = 0755;
};

/// Makes the directory and every missing one above it, each with the attributes. One that exists keeps its own. On
/// failure the error names the step and the system's text, and what was made stays; an owner that cannot be set is such
/// a failure.
[[nodiscard]] std::optional<Error> makeDirectories(const DiskPath& path, const DirectoryAttributes& attributes);

/// Makes an empty file of mode 0644 where nothing stands yet. A link that stands there is an error, not followed.
[[nodiscard]] std::optional<Error> makeEmptyFile(const DiskPath& path);

/// The id of a group in the account files below the system root; nothing if there is none of that name.
[[nodiscard]] std::optional<gid_t> groupIdOf(const char* name);

}  // namespace adminhost
