#pragma once

// Starts a child process. Every child of this system is started here: tools, the worker, and trials of plug-ins.
//
// The child shares our memory until it executes its program, so that starting it costs the same however much memory we
// use; in that time it makes raw system calls only. It gets its own process group unless the plan keeps ours, no
// blocked signal, every signal at its default action, and exactly the descriptors of the plan. Nothing else is
// inherited: not even a descriptor that is not close-on-exec.

#include "platform/files/FileDescriptor.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"

#include <atomic>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

namespace adminhost {

/// The account that a child runs as.
struct ADMINHOST_EXPORT ChildRights {
    uid_t user;
    gid_t group;
    std::vector<gid_t> groups;  ///< its supplementary groups, all of them
};

struct ADMINHOST_EXPORT ChildPlan {
    std::string program;                   ///< absolute path
    std::vector<std::string> arguments;    ///< the whole argument vector, the name of the program first
    std::vector<std::string> environment;  ///< "NAME=value"
    /// What becomes the child's descriptors 0, 1, 2 and so on, each -1 for /dev/null. They stay open here.
    std::vector<int> descriptors = {-1, -1, -1};
    std::optional<std::string> directory;  ///< without one, the child keeps our current directory
    std::optional<mode_t> fileModeMask;    ///< without one, the child keeps our umask
    /// Where the child writes its own process id before it executes the program, or null. In memory shared with another
    /// process, this shows that process which children run, also if we die. A child whose parent dies before the id is
    /// written does not execute the program. After a failure the id is 0 again; otherwise the caller sets it to 0,
    /// before it reaps the child.
    std::atomic<pid_t>* registration = nullptr;
    std::optional<ChildRights> rights;  ///< without them, the child keeps ours
    bool noNewPrivileges = false;       ///< no program that the child executes gets more rights than the child has
    /// What confines the child (Confinement::descriptor()), or -1. Needs noNewPrivileges. The program, and its loader,
    /// must be allowed.
    int confinement = -1;
    /// Without it, the child stays in our process group: it can then read from our terminal, and gets the signals of
    /// that terminal.
    bool ownGroup = true;
};

struct ADMINHOST_EXPORT StartedChild {
    pid_t pid = 0;        ///< also the id of its process group, if it has its own
    FileDescriptor exit;  ///< a pidfd: readable when the child has exited
};

/// Returns once the program is being executed. Fails (domain "posix", the system's number and text) when it cannot be
/// executed, or when a text holds a NUL byte or the path is not absolute (EINVAL); no child is left then.
[[nodiscard]] ADMINHOST_EXPORT Result<StartedChild> startChild(const ChildPlan& plan);

/// This process's environment, for a plan.
[[nodiscard]] ADMINHOST_EXPORT std::vector<std::string> processEnvironment();

}  // namespace adminhost
