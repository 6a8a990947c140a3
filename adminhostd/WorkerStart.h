#pragma once

// Starts the daemon's other programs, as the monitor and the check do.

#include "platform/files/FileDescriptor.h"
#include "platform/task/ToolRegister.h"
#include "platform/value/Result.h"

#include <string>

#include <sys/types.h>

namespace adminhost {

struct StartedWorker {
    pid_t pid = 0;
    FileDescriptor process;       ///< a pidfd: readable when the worker has exited
    FileDescriptor conversation;  ///< blocking; the worker ends when its other end is closed
    ToolRegister tools;           ///< that the worker runs
};

/// Starts a worker. Operations print to its standard output, which is ours (a service manager keeps it), or our
/// standard error if the log goes there.
[[nodiscard]] Result<StartedWorker> startWorker(bool outputToStandardError);

/// How a process ended, from its status of wait(): "was killed by signal 11 (Segmentation fault)".
[[nodiscard]] std::string endingText(int status);

/// The path of a program of the daemon: beside this one in a build, in the library directory next to ours when
/// installed.
[[nodiscard]] std::string programOfDaemon(const std::string& name);

}  // namespace adminhost
