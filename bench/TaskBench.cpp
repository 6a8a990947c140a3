// Launching a tool with captured output against bare posix_spawn with two pipes, read to their ends, and waitpid.

#include "bench/Alternating.h"
#include "platform/task/Task.h"

#include <array>
#include <cstdlib>
#include <string>

#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace adminhost;

void launchOurs(const std::string& tool, const std::vector<std::string>& arguments) {
    std::string output;
    std::string error;
    if (launch_task(DiskPath(tool), arguments, &output, &error) != 0) {
        std::abort();
    }
    benchmark::DoNotOptimize(output);
}

std::string readToEnd(int descriptor) {
    std::string text;
    std::array<char, 65536> buffer;
    for (ssize_t count = 0; (count = ::read(descriptor, buffer.data(), buffer.size())) > 0;) {
        text.append(buffer.data(), static_cast<std::size_t>(count));
    }
    ::close(descriptor);
    return text;
}

void launchBare(const std::string& tool, const std::vector<std::string>& arguments) {
    std::vector<char*> pointers = {const_cast<char*>(tool.c_str())};
    for (const std::string& argument : arguments) {
        pointers.push_back(const_cast<char*>(argument.c_str()));
    }
    pointers.push_back(nullptr);
    int output[2];
    int error[2];
    if (::pipe2(output, O_CLOEXEC) != 0 || ::pipe2(error, O_CLOEXEC) != 0) {
        std::abort();
    }
    posix_spawn_file_actions_t actions;
    ::posix_spawn_file_actions_init(&actions);
    ::posix_spawn_file_actions_adddup2(&actions, output[1], STDOUT_FILENO);
    ::posix_spawn_file_actions_adddup2(&actions, error[1], STDERR_FILENO);
    pid_t pid = 0;
    if (::posix_spawn(&pid, tool.c_str(), &actions, nullptr, pointers.data(), environ) != 0) {
        std::abort();
    }
    ::posix_spawn_file_actions_destroy(&actions);
    ::close(output[1]);
    ::close(error[1]);
    auto text = readToEnd(output[0]);
    benchmark::DoNotOptimize(text);
    text = readToEnd(error[0]);
    int status = 0;
    if (::waitpid(pid, &status, 0) != pid || status != 0) {
        std::abort();
    }
}

void LaunchTrueAgainstBareSpawn(benchmark::State& state) {
    bench::alternate(
        state, bench::Clock::wall, [] { launchOurs("/bin/true", {}); }, [] { launchBare("/bin/true", {}); }, [] {});
}

void LaunchSqliteAgainstBareSpawn(benchmark::State& state) {
    const std::vector<std::string> arguments = {"-line", ":memory:", "select 1 as one"};
    bench::alternate(
        state, bench::Clock::wall, [&] { launchOurs("/usr/bin/sqlite3", arguments); },
        [&] { launchBare("/usr/bin/sqlite3", arguments); }, [] {});
}

BENCHMARK(LaunchTrueAgainstBareSpawn)->UseManualTime()->Unit(benchmark::kMicrosecond)->Iterations(1000);
BENCHMARK(LaunchSqliteAgainstBareSpawn)->UseManualTime()->Unit(benchmark::kMicrosecond)->Iterations(1000);

}  // namespace

BENCHMARK_MAIN();
