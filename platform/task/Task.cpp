#include "platform/task/Task.h"

#include "platform/task/TaskBounds.h"
#include "platform/task/TaskGroup.h"

#include <atomic>
#include <csignal>
#include <utility>

#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

using Clock = std::chrono::steady_clock;

std::atomic<Clock::time_point> deadlineOfTasks = Clock::time_point::max();
std::atomic<std::size_t> outputBoundOfTasks = taskDefaultOutputBound;
std::map<std::string, std::string> variablesOfToolFiles;

}  // namespace

std::int32_t launch_task(const DiskPath& tool, const std::vector<std::string>& arguments, std::string* output,
                         std::string* error) {
    return launch_task_with_input_and_environment(tool, arguments, std::nullopt, output, error, {});
}

std::int32_t launch_task_with_input(const DiskPath& tool, const std::vector<std::string>& arguments,
                                    const std::optional<std::string>& input, std::string* output, std::string* error) {
    return launch_task_with_input_and_environment(tool, arguments, input, output, error, {});
}

std::int32_t launch_task_with_input_and_environment(const DiskPath& tool, const std::vector<std::string>& arguments,
                                                    const std::optional<std::string>& input, std::string* output,
                                                    std::string* error,
                                                    const std::map<std::string, std::string>& environment) {
    TaskGroup group;
    TaskResult result =
        group.collect(group.start({tool, arguments, input, environment, output != nullptr, error != nullptr}));
    if (output != nullptr) {
        *output = std::move(result.output);
    }
    if (error != nullptr) {
        *error = std::move(result.error);
    }
    return result.status;
}

void prepareForTasks() noexcept {
    ::umask(022);
    [[maybe_unused]] const int moved = ::chdir("/");  // if even that fails, tools run where the daemon was started
    struct sigaction standard {};
    standard.sa_handler = SIG_DFL;
    ::sigaction(SIGCHLD, &standard, nullptr);
}

void setTaskDeadline(std::optional<Clock::time_point> deadline) noexcept {
    deadlineOfTasks = deadline.value_or(Clock::time_point::max());
}

Clock::time_point taskDeadline() noexcept {
    return deadlineOfTasks;
}

const std::map<std::string, std::string>& toolFileVariables() noexcept {
    return variablesOfToolFiles;
}

void setToolFileVariables(std::map<std::string, std::string> variables) {
    variablesOfToolFiles = std::move(variables);
}

void setTaskOutputBound(std::size_t bytes) noexcept {
    outputBoundOfTasks = bytes;
}

std::size_t taskOutputBound() noexcept {
    return outputBoundOfTasks;
}

}  // namespace adminhost
