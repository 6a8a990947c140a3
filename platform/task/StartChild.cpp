#include "platform/task/StartChild.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <csignal>
#include <cstdint>
#include <string_view>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <sched.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

static_assert(std::atomic<pid_t>::is_always_lock_free, "a child that shares our memory must not take a lock");

/// The kernel's own set of signals. The C library's calls leave out the two signals that it uses itself.
using KernelSignals = std::uint64_t;

/// The child's part of the plan, as plain data.
struct ChildSide {
    const char* program;
    char* const* arguments;
    char* const* environment;
    const int* descriptors;
    int descriptorCount;
    int failure;  ///< write end of a pipe; the system's error number goes there
    const char* directory;
    const mode_t* fileModeMask;
    const ChildRights* rights;
    const gid_t* groups;
    std::size_t groupCount;
    bool noNewPrivileges;
    int confinement;
    bool ownGroup;
    std::atomic<pid_t>* registration;
    pid_t parent;
};

// Known to both compilers in this form only.
#define NOT_INSTRUMENTED __attribute__((no_sanitize("address", "undefined")))

// From the birth of the child to the start of its program: no allocation, no lock, no C++ library, because the child
// uses our memory. Not instrumented, because the sanitizer would record this stack as ours.

/// Registers the child. Until that is done it must not outlive its parent: no process would know of it.
NOT_INSTRUMENTED bool enter(const ChildSide& side) {
    if (side.registration == nullptr) {
        return true;
    }
    if (::syscall(SYS_prctl, PR_SET_PDEATHSIG, SIGKILL, 0, 0, 0) != 0 || ::syscall(SYS_getppid) != side.parent) {
        return false;
    }
    side.registration->store(static_cast<pid_t>(::syscall(SYS_getpid)));
    return ::syscall(SYS_prctl, PR_SET_PDEATHSIG, 0, 0, 0, 0) == 0;
}

/// No later step opens a file.
NOT_INSTRUMENTED bool confine(const ChildSide& side) {
    if (side.noNewPrivileges && ::syscall(SYS_prctl, PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) {
        return false;
    }
    return side.confinement < 0 || ::syscall(SYS_landlock_restrict_self, side.confinement, 0) == 0;
}

/// The descriptors, the confinement, the directory and the umask. The sources are all above the numbers that they go
/// to.
NOT_INSTRUMENTED bool place(const ChildSide& side) {
    for (int number = 0; number < side.descriptorCount; ++number) {
        int source = side.descriptors[number];
        if (source < 0) {
            source = static_cast<int>(::syscall(SYS_openat, AT_FDCWD, "/dev/null", O_RDWR, 0));
        }
        if (source < 0 || (source != number && ::syscall(SYS_dup3, source, number, 0) < 0)) {
            return false;
        }
    }
    if (!confine(side)) {
        return false;
    }
    // Ours are all close-on-exec; this is for those that a library opened without it.
    if (side.failure > side.descriptorCount &&
        ::syscall(SYS_close_range, side.descriptorCount, side.failure - 1, 0) != 0) {
        return false;
    }
    if (::syscall(SYS_close_range, side.failure + 1, ~0U, 0) != 0) {
        return false;
    }
    if (side.fileModeMask != nullptr) {
        ::syscall(SYS_umask, *side.fileModeMask);
    }
    return side.directory == nullptr || ::syscall(SYS_chdir, side.directory) == 0;
}

/// By raw calls: those of the C library would change every thread of ours.
NOT_INSTRUMENTED bool drop(const ChildSide& side) {
    if (side.rights == nullptr) {
        return true;
    }
    const uid_t user = side.rights->user;
    const gid_t group = side.rights->group;
    return ::syscall(SYS_setgroups, side.groupCount, side.groups) == 0 &&
           ::syscall(SYS_setresgid, group, group, group) == 0 && ::syscall(SYS_setresuid, user, user, user) == 0;
}

/// Last, so that no handler of ours runs in the child: every signal has been blocked so far.
NOT_INSTRUMENTED bool signals() {
    const unsigned long standard[8] = {};  // at least the kernel's struct sigaction: default action, no flags
    for (int number = 1; number < NSIG; ++number) {
        ::syscall(SYS_rt_sigaction, number, standard, nullptr, sizeof(KernelSignals));  // two may not be changed
    }
    const KernelSignals none = 0;
    return ::syscall(SYS_rt_sigprocmask, SIG_SETMASK, &none, nullptr, sizeof none) == 0;
}

NOT_INSTRUMENTED bool prepare(const ChildSide& side) {
    return (!side.ownGroup || ::syscall(SYS_setpgid, 0, 0) == 0) && enter(side) && place(side) && drop(side) &&
           signals();
}

NOT_INSTRUMENTED int runChild(void* argument) {
    const auto* side = static_cast<const ChildSide*>(argument);
    if (prepare(*side)) {
        ::syscall(SYS_execve, side->program, side->arguments, side->environment);
    }
    const int number = errno;
    [[maybe_unused]] const long written = ::syscall(SYS_write, side->failure, &number, sizeof number);
    ::syscall(SYS_exit_group, 127);
    __builtin_unreachable();
}

/// Blocks every signal, also those of the C library.
class WithoutSignals {
  public:
    WithoutSignals() noexcept {
        const KernelSignals all = ~KernelSignals{0};
        ::syscall(SYS_rt_sigprocmask, SIG_SETMASK, &all, &_before, sizeof all);
    }
    WithoutSignals(const WithoutSignals&) = delete;
    WithoutSignals& operator=(const WithoutSignals&) = delete;
    ~WithoutSignals() { ::syscall(SYS_rt_sigprocmask, SIG_SETMASK, &_before, nullptr, sizeof _before); }

  private:
    KernelSignals _before = 0;
};

tl::unexpected<Error> failed(int number) {
    return failure(Error{"posix", number, std::generic_category().message(number)});
}

bool holdsNul(const std::string& text) noexcept {
    return text.find('\0') != std::string::npos;
}

bool isUsable(const ChildPlan& plan) noexcept {
    return plan.program.starts_with('/') && !holdsNul(plan.program) &&
           std::none_of(plan.arguments.begin(), plan.arguments.end(), holdsNul) &&
           std::none_of(plan.environment.begin(), plan.environment.end(), holdsNul) &&
           (!plan.directory || !holdsNul(*plan.directory));
}

/// The null-terminated vector of the exec family. It points into the texts and does not change them.
std::vector<char*> pointersTo(const std::vector<std::string>& texts) {
    std::vector<char*> pointers;
    pointers.reserve(texts.size() + 1);
    for (const std::string& text : texts) {
        pointers.push_back(const_cast<char*>(text.c_str()));
    }
    pointers.push_back(nullptr);
    return pointers;
}

/// A duplicate that is at least the given number, so that placing one descriptor does not overwrite the source of
/// another.
FileDescriptor lifted(int descriptor, int least) noexcept {
    return FileDescriptor(::fcntl(descriptor, F_DUPFD_CLOEXEC, least));
}

/// Kills the started child and waits for it.
void discard(pid_t pid) noexcept {
    ::kill(pid, SIGKILL);
    while (::waitpid(pid, nullptr, 0) < 0 && errno == EINTR) {
    }
}

/// Starts the child and returns once it executes its program, or has failed to.
pid_t cloneChild(ChildSide& side) noexcept {
    alignas(16) std::array<std::byte, 32768> stack;  // the child's until it executes its program
    const WithoutSignals guard;
    return ::clone(&runChild, stack.data() + stack.size(), CLONE_VM | CLONE_VFORK | SIGCHLD, &side);
}

}  // namespace

Result<StartedChild> startChild(const ChildPlan& plan) {
    if (!isUsable(plan)) {
        return failed(EINVAL);
    }
    const int count = static_cast<int>(plan.descriptors.size());
    std::vector<int> sources = plan.descriptors;
    std::vector<FileDescriptor> duplicates;
    for (int& source : sources) {
        if (source >= 0 && source < count) {
            source = duplicates.emplace_back(lifted(source, count)).get();
            if (source < 0) {
                return failed(errno);
            }
        }
    }
    int confinement = plan.confinement;
    if (confinement >= 0 && confinement < count) {
        confinement = duplicates.emplace_back(lifted(confinement, count)).get();
        if (confinement < 0) {
            return failed(errno);
        }
    }
    int ends[2];
    if (::pipe2(ends, O_CLOEXEC) != 0) {
        return failed(errno);
    }
    const FileDescriptor report(ends[0]);
    FileDescriptor reporter(ends[1]);
    if (reporter.get() < count) {
        reporter = lifted(reporter.get(), count);
        if (!reporter.isOpen()) {
            return failed(errno);
        }
    }
    const std::vector<char*> arguments = pointersTo(plan.arguments);
    const std::vector<char*> environment = pointersTo(plan.environment);
    ChildSide side{};
    side.program = plan.program.c_str();
    side.arguments = arguments.data();
    side.environment = environment.data();
    side.descriptors = sources.data();
    side.descriptorCount = count;
    side.failure = reporter.get();
    side.directory = plan.directory ? plan.directory->c_str() : nullptr;
    side.fileModeMask = plan.fileModeMask ? &*plan.fileModeMask : nullptr;
    side.rights = plan.rights ? &*plan.rights : nullptr;
    side.groups = plan.rights ? plan.rights->groups.data() : nullptr;
    side.groupCount = plan.rights ? plan.rights->groups.size() : 0;
    side.noNewPrivileges = plan.noNewPrivileges;
    side.confinement = confinement;
    side.ownGroup = plan.ownGroup;
    side.registration = plan.registration;
    side.parent = ::getpid();
    const int dumpable = ::prctl(PR_GET_DUMPABLE);
    const pid_t pid = cloneChild(side);
    if (pid < 0) {
        return failed(errno);
    }
    if (plan.rights && dumpable == 1) {
        ::prctl(PR_SET_DUMPABLE, dumpable);  // dropping rights has cleared it for the memory that the child shared
    }
    if (::close(reporter.release()) != 0) {
        // The end may still be open and keep the pipe from ending. Whatever the child had to report is in the pipe by
        // now.
        ::fcntl(report.get(), F_SETFL, O_NONBLOCK);
    }
    int number = 0;
    ssize_t read = 0;
    do {
        read = ::read(report.get(), &number, sizeof number);
    } while (read < 0 && errno == EINTR);
    StartedChild started{pid, FileDescriptor()};
    if (read == 0 || (read < 0 && errno == EAGAIN)) {  // the program's execution closed the child's end unused
        // The C library declares its wrapper without C linkage.
        started.exit = FileDescriptor(static_cast<int>(::syscall(SYS_pidfd_open, pid, 0)));
        if (started.exit.isOpen()) {
            return started;
        }
        number = errno;
    }
    if (plan.registration != nullptr) {
        plan.registration->store(0);
    }
    discard(pid);
    return failed(number);
}

std::vector<std::string> processEnvironment() {
    std::vector<std::string> all;
    for (char** entry = environ; entry != nullptr && *entry != nullptr; ++entry) {
        all.emplace_back(*entry);
    }
    return all;
}

}  // namespace adminhost
