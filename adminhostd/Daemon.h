#pragma once

// The front's life: from its start by the monitor to the last answer.

#include "adminhostd/Options.h"
#include "platform/files/FileDescriptor.h"

namespace adminhost {

/// Blocks the signals that end the front, and SIGHUP, which is the monitor's, and ignores SIGPIPE. Returns where they
/// can be read.
[[nodiscard]] FileDescriptor stopSignals();

/// Serves the listening socket until SIGTERM or SIGINT, or until the monitor at the other end of the link ends. Then it
/// finishes the running operation: one that only reads within ten seconds. Returns the exit status; throws
/// std::exception if the front cannot start.
[[nodiscard]] int runDaemon(const Options& options, FileDescriptor signals, FileDescriptor link,
                            FileDescriptor listener);

}  // namespace adminhost
