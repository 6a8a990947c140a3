#pragma once

// Files that the command line writes for people.

#include <string>
#include <string_view>

namespace adminhost::ctl {

/// Writes a file as a whole: who reads it meets the old bytes or the new ones, and after a failure the old ones stand.
/// A new file can be read by its owner alone; one that is there keeps its mode. A link is followed. What is no file (a
/// pipe, a device) is written to. Throws Failure(usage) with the reason.
void writeOutput(const std::string& path, std::string_view bytes);

}  // namespace adminhost::ctl
