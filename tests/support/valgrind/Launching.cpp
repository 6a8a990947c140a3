// Preloaded into test programs that run below valgrind: calls for starting a child that valgrind 3.19 does not support.
// - pidfd_open(2): returns a descriptor that becomes readable when the child has exited, and does not reap the child.
//   waitid(2) accepts it.
// - execve(2) that fails with E2BIG. Valgrind checks the program's file itself, and ends the child when the call fails
//   for another reason.
// - execve(2) of /proc/self/exe, which is valgrind's own program. Valgrind shows the program under test as the link's
//   target.

#include <array>
#include <atomic>
#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <system_error>
#include <thread>

#include <dlfcn.h>
#include <fcntl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

/// The children of the descriptors that were returned in place of the kernel's; 0 for other descriptors.
std::array<std::atomic<pid_t>, 1024> children;

int readableAfterExitOf(pid_t child) noexcept {
    std::array<int, 2> pipe{};
    if (::pipe2(pipe.data(), O_CLOEXEC) != 0) {
        return -1;
    }
    try {
        std::thread([child, end = pipe[1]] {
            siginfo_t ignored{};
            while (::waitid(P_PID, static_cast<id_t>(child), &ignored, WEXITED | WNOWAIT) != 0 && errno == EINTR) {
            }
            ::close(end);  // poll reports it at the other end
        }).detach();
    } catch (const std::system_error& failure) {
        ::close(pipe[0]);
        ::close(pipe[1]);
        errno = failure.code().value();
        return -1;
    }
    if (static_cast<std::size_t>(pipe[0]) < children.size()) {
        children[static_cast<std::size_t>(pipe[0])] = child;
    }
    return pipe[0];
}

/// The link's target. It is read before the first child is started: a child shares our memory and must not write to it.
class OwnProgram {
  public:
    OwnProgram() noexcept {
        const ssize_t size = ::readlink(link, _path.data(), _path.size() - 1);
        if (size > 0) {
            _path[static_cast<std::size_t>(size)] = '\0';
        }
    }

    [[nodiscard]] const char* inPlaceOf(const char* path) const noexcept {
        return std::strcmp(path, link) == 0 ? _path.data() : path;
    }

  private:
    static constexpr const char* link = "/proc/self/exe";
    std::array<char, 4096> _path{};
};
const OwnProgram ownProgram;

bool hasTooLongArgument(char* const* argv) noexcept {
    constexpr std::size_t longestArgument = 32 * 4096 - 1;
    for (char* const* argument = argv; *argument != nullptr; ++argument) {
        if (std::strlen(*argument) > longestArgument) {
            return true;
        }
    }
    return false;
}

}  // namespace

extern "C" int waitid(idtype_t kind, id_t id, siginfo_t* info, int options) {
    if (kind == P_PIDFD && id < children.size() && children[id] != 0) {
        kind = P_PID;
        id = static_cast<id_t>(children[id]);
    }
    static const auto real = reinterpret_cast<decltype(&waitid)>(::dlsym(RTLD_NEXT, "waitid"));
    return real(kind, id, info, options);
}

extern "C" long syscall(long number, ...) noexcept {
    std::array<long, 6> arguments{};
    va_list list;
    va_start(list, number);
    for (long& argument : arguments) {
        argument = va_arg(list, long);  // like the real one, which does not know their number either
    }
    va_end(list);
    if (number == SYS_pidfd_open) {
        return readableAfterExitOf(static_cast<pid_t>(arguments[0]));
    }
    if (number == SYS_execve) {
        if (hasTooLongArgument(reinterpret_cast<char* const*>(arguments[1]))) {
            errno = E2BIG;
            return -1;
        }
        arguments[0] = reinterpret_cast<long>(ownProgram.inPlaceOf(reinterpret_cast<const char*>(arguments[0])));
    }
    static const auto real = reinterpret_cast<decltype(&syscall)>(::dlsym(RTLD_NEXT, "syscall"));
    return real(number, arguments[0], arguments[1], arguments[2], arguments[3], arguments[4], arguments[5]);
}
