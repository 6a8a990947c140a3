#include "platform/task/Child.h"

#include "platform/task/ToolRegister.h"

#include <cerrno>
#include <csignal>
#include <utility>

#include <fcntl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr int outputRoom = 1 << 20;  ///< bytes: what every process may have

/// A descriptor above the standard streams: a process that was started with one of them closed would otherwise get
/// pipe ends in their places, and setting up the child's streams would overwrite one end with another.
bool liftAboveStandardStreams(FileDescriptor& descriptor) noexcept {
    if (descriptor.get() > STDERR_FILENO) {
        return true;
    }
    descriptor = FileDescriptor(::fcntl(descriptor.get(), F_DUPFD_CLOEXEC, STDERR_FILENO + 1));
    return descriptor.isOpen();
}

/// A close-on-exec pipe of which our end does not block; the other end does, as tools expect.
int makePipe(FileDescriptor& readEnd, FileDescriptor& writeEnd, bool oursIsRead) noexcept {
    int ends[2];
    if (::pipe2(ends, O_CLOEXEC) != 0) {
        return errno;
    }
    readEnd = FileDescriptor(ends[0]);
    writeEnd = FileDescriptor(ends[1]);
    const bool done = liftAboveStandardStreams(readEnd) && liftAboveStandardStreams(writeEnd) &&
                      ::fcntl((oursIsRead ? readEnd : writeEnd).get(), F_SETFL, O_NONBLOCK) == 0;
    return done ? 0 : errno;
}

}  // namespace

Child::~Child() {
    kill();
    (void)wait();
}

int Child::start(ChildPlan plan, bool withInput) {
    FileDescriptor childInput;
    FileDescriptor childOutput;
    FileDescriptor childError;
    if (const int failure = withInput ? makePipe(childInput, input, false) : 0; failure != 0) {
        return failure;
    }
    if (const int failure = makePipe(output, childOutput, true); failure != 0) {
        return failure;
    }
    // A tool should not wait while what it has written is read. If the system refuses the size, the pipe keeps its own.
    static_cast<void>(::fcntl(output.get(), F_SETPIPE_SZ, outputRoom));
    if (const int failure = makePipe(error, childError, true); failure != 0) {
        return failure;
    }
    plan.descriptors = {childInput.get(), childOutput.get(), childError.get()};
    if (ToolRegister* known = toolRegister(); known != nullptr) {
        plan.registration = known->claim();
        if (plan.registration == nullptr) {
            return EAGAIN;
        }
    }
    auto started = startChild(plan);
    if (!started) {
        if (plan.registration != nullptr) {
            plan.registration->store(0);
        }
        return static_cast<int>(started.error().code);
    }
    _pid = started->pid;
    _registration = plan.registration;
    exit = std::move(started->exit);
    return 0;
}

void Child::kill() noexcept {
    siginfo_t exited{};
    if (_pid > 0 && !_exited && ::waitid(P_PID, static_cast<id_t>(_pid), &exited, WEXITED | WNOHANG | WNOWAIT) == 0 &&
        exited.si_pid == 0) {
        ::kill(-_pid, SIGKILL);
    }
}

void Child::noteExit() noexcept {
    _exited = true;
    if (_registration != nullptr) {
        std::exchange(_registration, nullptr)->store(0);
    }
}

std::int32_t Child::wait() noexcept {
    if (_pid <= 0) {
        return -1;
    }
    siginfo_t ignored{};
    while (!_exited && ::waitid(P_PID, static_cast<id_t>(_pid), &ignored, WEXITED | WNOWAIT) != 0 && errno == EINTR) {
    }
    noteExit();  // before the child is reaped: then its id may become that of another process
    int status = 0;
    pid_t waited = 0;
    do {
        waited = ::waitpid(_pid, &status, 0);
    } while (waited < 0 && errno == EINTR);
    _pid = 0;
    if (waited < 0) {
        return -1;
    }
    return WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
}

}  // namespace adminhost
