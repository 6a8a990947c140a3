#include "adminhostd/WorkerStart.h"

#include "platform/task/StartChild.h"

#include <cerrno>
#include <cstring>
#include <system_error>
#include <utility>

#include <fmt/format.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {

std::string programOfDaemon(const std::string& name) {
    char buffer[4096];
    const ssize_t length = ::readlink("/proc/self/exe", buffer, sizeof buffer);
    const std::string self(buffer, length < 0 ? 0 : static_cast<std::size_t>(length));
    const std::string directory = self.substr(0, self.rfind('/') + 1);
    std::string beside = directory + name;
    return ::access(beside.c_str(), X_OK) == 0 ? beside : directory + "../lib/adminhostd/" + name;
}

Result<StartedWorker> startWorker(bool outputToStandardError) {
    int ends[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, ends) != 0) {
        return failure(Error{"posix", errno, std::generic_category().message(errno)});
    }
    // As much as the system allows: the fewer pieces a large answer is sent in, the less often each end wakes the
    // other.
    for (const int end : ends) {
        constexpr int bytes = 1 << 20;
        ::setsockopt(end, SOL_SOCKET, SO_SNDBUF, &bytes, sizeof bytes);
    }
    FileDescriptor ours(ends[0]);
    const FileDescriptor other(ends[1]);
    auto tools = ToolRegister::create();
    if (!tools) {
        return failure(tools.error());
    }
    ChildPlan plan;
    plan.program = programOfDaemon("adminhostd-worker");
    plan.arguments = {"adminhostd-worker"};
    plan.environment = processEnvironment();
    plan.descriptors = {-1, outputToStandardError ? STDERR_FILENO : STDOUT_FILENO, STDERR_FILENO, other.get(),
                        tools->descriptor()};
    plan.directory = std::string("/");
    plan.fileModeMask = S_IWGRP | S_IWOTH;
    auto started = startChild(plan);
    if (!started) {
        return failure(started.error());
    }
    return StartedWorker{started->pid, std::move(started->exit), std::move(ours), *std::move(tools)};
}

std::string endingText(int status) {
    return WIFSIGNALED(status)
               ? fmt::format("was killed by signal {} ({})", WTERMSIG(status), ::strsignal(WTERMSIG(status)))
               : fmt::format("ended with status {}", WEXITSTATUS(status));
}

}  // namespace adminhost
