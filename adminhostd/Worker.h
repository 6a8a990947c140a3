#pragma once

// The worker: the process that loads the plug-ins and runs their operations, one at a time.
//
// The monitor starts it on one end of a socket pair, whose other end the front has. It has one thread, and ends when
// the front closes its end. Protocol.h describes their messages.

namespace adminhost {

/// Serves the front on this descriptor until it closes its end. Returns the process's exit status.
[[nodiscard]] int runWorker(int descriptor);

}  // namespace adminhost
