#pragma once

// Where the daemon's socket and its private directories are.

#include "adminhostd/Options.h"

#include <string>

namespace adminhost {

/// The socket's path on disk. The run directory is created when the socket is to be in it and it is missing.
[[nodiscard]] std::string socketPath(const Options& options);

/// Where private directories are created: in the run directory or, with a socket elsewhere, in the system's directory
/// for temporary files.
[[nodiscard]] std::string privateParent(const Options& options);

}  // namespace adminhost
