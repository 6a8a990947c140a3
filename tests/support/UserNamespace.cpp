#include "tests/support/UserNamespace.h"

#include <array>
#include <cstdlib>
#include <fstream>
#include <stdexcept>

#include <fcntl.h>
#include <grp.h>
#include <sched.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

/// The ids keep their numbers, so that a temporary directory that is closed to others stays usable.
constexpr const char* range = "0 0 65536\n";

/// The child's part: waits until its ids are mapped, becomes root of the namespace, and runs the command.
[[noreturn]] void runMapped(const std::vector<std::string>& command, int output, int unshared, int mapped) {
    std::vector<char*> arguments;
    for (const std::string& word : command) {
        arguments.push_back(const_cast<char*>(word.c_str()));
    }
    arguments.push_back(nullptr);
    char ready = 0;
    if (::unshare(CLONE_NEWUSER | CLONE_NEWNS) == 0 && ::write(unshared, &ready, 1) == 1 &&
        ::read(mapped, &ready, 1) == 1 && ::setgroups(0, nullptr) == 0 && ::setresgid(0, 0, 0) == 0 &&
        ::setresuid(0, 0, 0) == 0 && ::dup2(output, STDOUT_FILENO) >= 0 && ::dup2(output, STDERR_FILENO) >= 0) {
        ::execv(arguments.front(), arguments.data());
    }
    ::_exit(127);
}

ProgramResult runAsRoot(const std::vector<std::string>& command) {
    std::array<int, 2> output{};
    std::array<int, 2> unshared{};
    std::array<int, 2> mapped{};
    for (auto* pipe : {&output, &unshared, &mapped}) {
        if (::pipe2(pipe->data(), O_CLOEXEC) != 0) {
            throw std::runtime_error("no pipe");
        }
    }
    const pid_t child = ::fork();
    if (child == 0) {
        runMapped(command, output[1], unshared[1], mapped[0]);
    }
    ::close(output[1]);
    ::close(unshared[1]);
    char ready = 0;
    if (::read(unshared[0], &ready, 1) == 1) {
        const std::string process = "/proc/" + std::to_string(child);
        std::ofstream(process + "/uid_map") << range;
        std::ofstream(process + "/gid_map") << range;
        if (::write(mapped[1], &ready, 1) != 1) {
            throw std::runtime_error("cannot start the child");
        }
    }
    ::close(mapped[1]);
    ProgramResult result;
    std::array<char, 4096> buffer{};
    for (ssize_t count = 0; (count = ::read(output[0], buffer.data(), buffer.size())) > 0;) {
        result.output.append(buffer.data(), static_cast<std::size_t>(count));
    }
    for (const int end : {output[0], unshared[0], mapped[0]}) {
        ::close(end);
    }
    int status = 0;
    ::waitpid(child, &status, 0);
    result.status = WIFSIGNALED(status) ? 128 + WTERMSIG(status) : WEXITSTATUS(status);
    if (result.status == 127) {
        result.output +=
            "This test needs user namespaces: allow them (in a container its option for unshare, such as an "
            "unconfined seccomp profile), and let every account read the build directory\n";
    }
    return result;
}

}  // namespace

ProgramResult runInMappedNamespace(const std::vector<std::string>& command) {
    if (::geteuid() == 0) {
        return runAsRoot(command);
    }
    std::vector<std::string> words = {"/usr/bin/unshare", "--map-root-user", "--map-auto", "--mount", "--"};
    words.insert(words.end(), command.begin(), command.end());
    ProgramResult result = runProgram(words, Errors::merge);
    if (result.status != 0) {
        result.output +=
            "If unshare itself failed: this test needs user namespaces with a range of ids. Install the "
            "package uidmap, grant the account a range in /etc/subuid and /etc/subgid, and allow user "
            "namespaces (sysctl kernel.unprivileged_userns_clone=1)\n";
    }
    return result;
}

}  // namespace adminhost::test
