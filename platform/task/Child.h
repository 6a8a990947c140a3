#pragma once

// One running child process with our ends of its pipes. While it runs, its id is in the process's register
// (ToolRegister.h), if there is one. The destructor kills the process group of a child that was not
// waited for, so that no way out of a launch leaves a zombie or a stray.

#include "platform/files/FileDescriptor.h"
#include "platform/framework/Export.h"
#include "platform/task/StartChild.h"

#include <atomic>
#include <cstdint>

#include <sys/types.h>

namespace adminhost {

class ADMINHOST_EXPORT Child {
  public:
    Child() = default;
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;
    ~Child();

    /// Starts the tool of the plan in a process group of its own, with pipes as its descriptors. Its standard input is
    /// a pipe if `withInput` is true, else /dev/null. Returns the system's error number, 0 for success. Called once.
    [[nodiscard]] int start(ChildPlan plan, bool withInput);

    /// Sends SIGKILL to the child's process group, unless the child itself has exited: a process that it left in its
    /// group is a daemon that must go on.
    void kill() noexcept;

    /// Call when `exit` is readable: the child is no longer in the process's register (ToolRegister.h).
    void noteExit() noexcept;

    /// Waits for the exit of this very child. Returns its status, 128 + the number of the signal that ended it, or -1
    /// if the system does not know it.
    [[nodiscard]] std::int32_t wait() noexcept;

    FileDescriptor input;   ///< write end, non-blocking; empty without input
    FileDescriptor output;  ///< read end, non-blocking
    FileDescriptor error;   ///< read end, non-blocking
    FileDescriptor exit;    ///< becomes readable when the child has exited

  private:
    pid_t _pid = 0;  ///< 0: no child to wait for
    bool _exited = false;
    std::atomic<pid_t>* _registration = nullptr;
};

}  // namespace adminhost
