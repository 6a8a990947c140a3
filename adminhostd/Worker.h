#pragma once

// The worker: the process that loads the plug-ins and runs their operations, one at a time.
//
// It is started by the front, on the other end of an inherited socket pair, has one thread, and ends when the front
// closes its end. What the two say to each other is in Protocol.h.

namespace adminhost {

/// Serves the front on this descriptor until it closes its end. Returns the process's exit status.
[[nodiscard]] int runWorker(int descriptor);

}  // namespace adminhost
