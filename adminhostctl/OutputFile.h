#pragma once

// Writes the files that a person asked for, such as an export.

#include <string>
#include <string_view>

namespace adminhost::ctl {

/// Replaces a file as a whole: a reader sees the old bytes or the new ones, and after a failure the file has its old
/// bytes. A new file can be read by its owner alone; an existing one keeps its mode. A link is followed. If the path is
/// not a regular file (a pipe, a device), the bytes are written to it. Throws Failure(usage) with the reason.
void writeOutput(const std::string& path, std::string_view bytes);

}  // namespace adminhost::ctl
