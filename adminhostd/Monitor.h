#pragma once

// The monitor: what the service manager starts. It keeps the daemon's privileges and reads nothing that clients send.
//
// It opens the socket, or inherits it from the service manager, and starts the front with it. For the front it starts
// workers, ends them with their tools, and reaps them (MonitorMessage.h). A front that dies leaves its worker to finish
// the operation that it has begun; the next front gets a worker once that one has ended. If the monitor itself dies,
// the front finishes the running operation and ends, and so does the worker.

#include "adminhostd/Options.h"

#include <string>
#include <vector>

namespace adminhost {

/// Serves until SIGTERM or SIGINT; SIGHUP makes it read the configuration again and hand it to the front. The front
/// gets the arguments, the first of which is the program's name. Returns the exit status: 0, or that of a front that
/// could not start. Throws std::exception if the daemon cannot be started.
[[nodiscard]] int runMonitor(const Options& options, std::vector<std::string> arguments);

}  // namespace adminhost
