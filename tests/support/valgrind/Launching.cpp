// Preloaded into test programs that run below valgrind: calls for starting a child that valgrind 3.19 does not support.
// - pidfd_open(2): returns a descriptor that becomes readable when the child has exited, and does not reap the child.
// - execve(2) that fails with E2BIG. Valgrind checks the program's file itself, and ends the child when the call fails
//   for another reason.

#include <array>
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
    return pipe[0];
}

template <class Function>
Function realFunction(Function /*mine*/, const char* name) noexcept {
    return reinterpret_cast<Function>(::dlsym(RTLD_NEXT, name));
}

}  // namespace

extern "C" int execve(const char* path, char* const* argv, char* const* envp) noexcept {
    constexpr std::size_t longestArgument = 32 * 4096 - 1;
    for (char* const* argument = argv; *argument != nullptr; ++argument) {
        if (std::strlen(*argument) > longestArgument) {
            errno = E2BIG;
            return -1;
        }
    }
    static const auto real = realFunction(&execve, "execve");
    return real(path, argv, envp);
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
    static const auto real = realFunction(&syscall, "syscall");
    return real(number, arguments[0], arguments[1], arguments[2], arguments[3], arguments[4], arguments[5]);
}
