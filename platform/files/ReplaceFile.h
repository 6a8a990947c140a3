#pragma once

// Replacing a file as a whole, so that whoever reads it meets either the old bytes or the new ones, also after a crash.

#include "platform/files/Path.h"
#include "platform/value/Error.h"

#include <optional>
#include <string_view>

#include <sys/types.h>

namespace adminhost {

/// Writes a temporary file ".NAME.adminhost-" + 16 hexadecimal digits beside the file, flushes it, renames it over the
/// file and flushes the directory. Owner, mode, access control list and extended attributes of the old file are kept;
/// a new file has the given mode and belongs to the process's user. Labels and attributes that only the system may set,
/// and attributes that the file system does not know, are left to the system.
///
/// No link is followed: one in the file's place is itself replaced by a new file, one on the way only where
/// openPlace() allows it. Anything else in its place (a directory, a pipe) is an error.
///
/// On failure the old file stands as it was and no temporary file is left; the error (domain "posix", the system's
/// number) names the step, the host path and the system's text. One failure comes too late for that: when the
/// directory cannot be flushed the new file is in place, but might not outlast a power cut; the error says so.
///
/// Temporary files that killed processes left for the same file are removed first; those of living writers are not.
/// Several may write the same file at once, also from machines that share the directory: one of them is the last.
[[nodiscard]] std::optional<Error> replaceFile(std::string_view bytes, const HostPath& path, mode_t newMode = 0644);

/// Removes the temporary files that killed processes left for the file, as replaceFile() does before it writes. Those
/// that cannot be removed stay.
void removeLeftovers(const HostPath& path);

/// Keeps a file that cannot be loaded beside its place before it is replaced: as PATH ".unreadable-" and the moment
/// ("2026-01-31T080000Z", UTC), with "-2" and so on after it when that is taken. The file stays in its place too, so
/// that there is no moment without one; where it cannot have two names, or cannot be read by this process at all, it
/// is moved. A link is kept as a link; anything else than a file or link stays and is an error. Answers the new name,
/// or nothing, with the error, when it could not be kept.
[[nodiscard]] std::optional<HostPath> keepUnreadable(const HostPath& path, Error* error = nullptr);

}  // namespace adminhost
