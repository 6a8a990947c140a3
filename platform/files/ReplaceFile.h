#pragma once

// Replacing a file as a whole: a reader sees either the old bytes or the new ones, also after a crash.

#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"

#include <string_view>

#include <sys/types.h>

namespace adminhost {

/// The domain of replaceFile()'s error if the new file is in place, but its directory could not be flushed: the file
/// might be lost in a power cut.
inline constexpr std::string_view notFlushed = "not_flushed";

/// Writes a temporary file ".NAME.adminhost-" + 16 hexadecimal digits beside the file, flushes it, renames it over the
/// file and flushes the directory. Owner, mode, access control list and extended attributes of the old file are kept;
/// a new file has the given mode and belongs to the process's user. Labels and attributes that only the system may set,
/// and attributes that the file system does not know, are left to the system.
///
/// No link is followed. A link in the file's place is itself replaced by a new file; a link on the way is followed only
/// where openPlace() allows it. Anything else in its place (a directory, a pipe) is an error.
///
/// On failure the old file is unchanged and no temporary file is left. The error (domain "posix", the system's number)
/// names the step, the host path and the system's text. One failure comes too late for that: if the directory cannot be
/// flushed, the new file is in place. That error has the domain notFlushed.
///
/// Temporary files that killed processes left for the same file are removed first; those of running writers are not.
/// Several processes may write the same file at once, also from machines that share the directory: one of them is the
/// last.
[[nodiscard]] ADMINHOST_EXPORT Result<void> replaceFile(std::string_view bytes, const HostPath& path,
                                                        mode_t newMode = 0644);

/// Removes the temporary files that killed processes left for the file, as replaceFile() does before it writes. Those
/// that cannot be removed stay.
ADMINHOST_EXPORT void removeLeftovers(const HostPath& path);

/// Keeps a copy of a file that cannot be loaded before it is replaced: beside it, as PATH ".unreadable-" and the time
/// ("2026-01-31T080000Z", UTC), with "-2" and so on after it if that name exists. The file stays in its place too, so
/// that it is never missing. If it cannot have two names, or this process cannot read it at all, it is moved instead. A
/// link is kept as a link; anything else than a file or link stays and is an error. Returns the new name.
[[nodiscard]] ADMINHOST_EXPORT Result<HostPath> keepUnreadable(const HostPath& path);

}  // namespace adminhost
