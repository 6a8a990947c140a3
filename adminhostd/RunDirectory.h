#pragma once

// The places of the daemon's socket and its private directories.

#include "adminhostd/Options.h"

#include <string>

namespace adminhost {

/// The socket's path on disk. If it is in the run directory and that is missing, the directory is created.
[[nodiscard]] std::string socketPath(const Options& options);

/// Where private directories are created: beside the socket. Never in the system's directory for temporary files, from
/// which a cleaner may remove them.
[[nodiscard]] std::string privateParent(const Options& options);

}  // namespace adminhost
