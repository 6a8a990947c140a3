#pragma once

// Where the daemon's socket and its private directories are.

#include "adminhostd/Options.h"

#include <string>

namespace adminhost {

/// The socket's path on disk. The run directory is created when the socket is to be in it and it is missing.
[[nodiscard]] std::string socketPath(const Options& options);

/// Where private directories are created: beside the socket. Never in the system's directory for temporary files, from
/// which a cleaner may remove them.
[[nodiscard]] std::string privateParent(const Options& options);

}  // namespace adminhost
