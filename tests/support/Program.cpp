#include "tests/support/Program.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <system_error>

#include <fcntl.h>
#include <spawn.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

/// A descriptor at the beginning of a nameless file with these bytes.
int fileOf(std::string_view bytes) {
    const int file = ::memfd_create("input", MFD_CLOEXEC);
    if (file < 0 || ::write(file, bytes.data(), bytes.size()) != static_cast<ssize_t>(bytes.size()) ||
        ::lseek(file, 0, SEEK_SET) != 0) {
        throw std::system_error(errno, std::generic_category(), "input");
    }
    return file;
}

}  // namespace

ProgramResult runProgram(const std::vector<std::string>& command, Errors errors,
                         std::optional<std::string_view> input) {
    // A file in memory, so that neither side ever waits for the other.
    const int inputFile = input ? fileOf(*input) : -1;
    std::array<int, 2> pipe{};
    if (::pipe2(pipe.data(), O_CLOEXEC) != 0) {
        throw std::system_error(errno, std::generic_category(), "pipe");
    }
    posix_spawn_file_actions_t actions{};
    ::posix_spawn_file_actions_init(&actions);
    if (inputFile >= 0) {
        ::posix_spawn_file_actions_adddup2(&actions, inputFile, STDIN_FILENO);
    }
    ::posix_spawn_file_actions_adddup2(&actions, pipe[1], STDOUT_FILENO);
    if (errors == Errors::merge) {
        ::posix_spawn_file_actions_adddup2(&actions, pipe[1], STDERR_FILENO);
    }
    std::vector<char*> arguments;
    arguments.reserve(command.size() + 1);
    for (const auto& argument : command) {
        arguments.push_back(const_cast<char*>(argument.c_str()));
    }
    arguments.push_back(nullptr);
    pid_t child = -1;
    const int failure = ::posix_spawnp(&child, arguments[0], &actions, nullptr, arguments.data(), environ);
    ::posix_spawn_file_actions_destroy(&actions);
    ::close(pipe[1]);
    if (inputFile >= 0) {
        ::close(inputFile);
    }
    ProgramResult result;
    std::array<char, 65536> piece{};
    for (ssize_t count = 0; failure == 0 && (count = ::read(pipe[0], piece.data(), piece.size())) > 0;) {
        result.output.append(piece.data(), static_cast<std::size_t>(count));
    }
    ::close(pipe[0]);
    if (failure != 0) {
        throw std::runtime_error("cannot start " + command[0] + ": " + std::strerror(failure));
    }
    int status = 0;
    if (::waitpid(child, &status, 0) != child) {
        throw std::system_error(errno, std::generic_category(), "waitpid");
    }
    result.status = WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
    return result;
}

std::string namespaceProblem() {
    const ProgramResult result =
        runProgram({"/usr/bin/unshare", "--map-root-user", "--mount", "/bin/true"}, Errors::merge);
    return result.status == 0
               ? std::string()
               : result.output + "This test needs user and mount namespaces: allow them " +
                     "(sysctl kernel.unprivileged_userns_clone=1; in a container its option for unshare " +
                     "and mount, such as an unconfined seccomp profile)";
}

}  // namespace adminhost::test
