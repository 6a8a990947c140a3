#pragma once

// The daemon's life: from the socket to the last answer.

#include "adminhostd/Options.h"

namespace adminhost {

/// Serves until SIGTERM or SIGINT, then finishes the running operation within ten seconds. Returns the exit status.
[[nodiscard]] int runDaemon(const Options& options);

}  // namespace adminhost
