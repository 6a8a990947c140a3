// Preloaded into test programs that run below valgrind: what launching a child process needs and valgrind 3.19 lacks.
// - pidfd_open(2), which it answers with ENOSYS: a descriptor that turns readable when the child has exited; the child
//   is not waited for.
// - posix_spawn(3) answering that the program cannot be executed: valgrind's child shares no memory with its parent to
//   tell it. Here the usual reasons are looked for before.

#include <array>
#include <cerrno>
#include <cstdarg>
#include <cstring>
#include <string_view>
#include <system_error>
#include <thread>

#include <dlfcn.h>
#include <fcntl.h>
#include <spawn.h>
#include <sys/stat.h>
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
            ::close(end);  // poll tells the other end of it
        }).detach();
    } catch (const std::system_error& failure) {
        ::close(pipe[0]);
        ::close(pipe[1]);
        errno = failure.code().value();
        return -1;
    }
    return pipe[0];
}

/// The error of execve(2), 0 if none is to be expected.
int whyItCannotBeExecuted(const char* path, char* const* argv) noexcept {
    constexpr std::size_t longestArgument = 32 * 4096 - 1;
    for (char* const* argument = argv; *argument != nullptr; ++argument) {
        if (std::strlen(*argument) > longestArgument) {
            return E2BIG;
        }
    }
    if (::access(path, X_OK) != 0) {
        return errno;
    }
    struct stat status {};
    if (::stat(path, &status) == 0 && !S_ISREG(status.st_mode)) {
        return EACCES;
    }
    std::array<char, 4> start{};
    const int file = ::open(path, O_RDONLY | O_CLOEXEC);
    const bool isRead = ::read(file, start.data(), start.size()) >= 0;
    ::close(file);
    const std::string_view magic(start.data(), start.size());
    return isRead && magic != "\177ELF" && !magic.starts_with("#!") ? ENOEXEC : 0;
}

template <class Function>
Function realFunction(Function /*mine*/, const char* name) noexcept {
    return reinterpret_cast<Function>(::dlsym(RTLD_NEXT, name));
}

}  // namespace

extern "C" int posix_spawn(pid_t* pid, const char* path, const posix_spawn_file_actions_t* actions,
                           const posix_spawnattr_t* attributes, char* const* argv, char* const* envp) {
    if (const int failure = whyItCannotBeExecuted(path, argv); failure != 0) {
        return failure;
    }
    static const auto real = realFunction(&posix_spawn, "posix_spawn");
    return real(pid, path, actions, attributes, argv, envp);
}

extern "C" long syscall(long number, ...) noexcept {
    std::array<long, 6> arguments{};
    va_list list;
    va_start(list, number);
    for (long& argument : arguments) {
        argument = va_arg(list, long);  // as the real one does, which does not know either how many there are
    }
    va_end(list);
    if (number == SYS_pidfd_open) {
        return readableAfterExitOf(static_cast<pid_t>(arguments[0]));
    }
    static const auto real = realFunction(&syscall, "syscall");
    return real(number, arguments[0], arguments[1], arguments[2], arguments[3], arguments[4], arguments[5]);
}
