#pragma once

// Creating directories and empty files that are missing.

#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"

#include <optional>

#include <sys/types.h>

namespace adminhost {

struct ADMINHOST_EXPORT OwnerAndMode {
    uid_t owner = 0;
    gid_t group = 0;
    mode_t mode = 0755;
};

/// Creates the directory and every missing one above it, each with this owner and mode. An existing one keeps its own.
/// On failure the error names the step and the system's text, and created directories stay; an owner that cannot be set
/// is such a failure.
[[nodiscard]] ADMINHOST_EXPORT Result<void> createDirectories(const DiskPath& path, const OwnerAndMode& ownerAndMode);

/// Creates an empty file of mode 0644. An existing file or link of that name is an error; a link is not followed.
[[nodiscard]] ADMINHOST_EXPORT Result<void> createEmptyFile(const DiskPath& path);

/// The id of a group in the account files below the system root; nullopt if it is not found.
[[nodiscard]] ADMINHOST_EXPORT std::optional<gid_t> groupIdOf(const char* name);

}  // namespace adminhost
