#include "adminhostd/PluginTrial.h"

#include <csignal>
#include <cstring>
#include <filesystem>
#include <string>
#include <utility>
#include <vector>

#include <gtest/gtest.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

std::vector<pid_t> signalled;  ///< the arguments of kill()

/// Trials run this program: what it does with a file depends on the file's name. It begins before any test runs.
__attribute__((constructor)) void serveAsTrial(int argc, char** argv) {
    if (argc != 3 || std::strcmp(argv[1], adminhost::trialArgument) != 0) {
        return;
    }
    const std::string file = argv[2];
    if (file == "/loops") {
        ::pause();
    }
    ::_exit(::write(3, file == "/good" ? "+" : "-no", file == "/good" ? 1 : 3) > 0 ? 0 : 1);
}

}  // namespace

/// In place of the system's.
extern "C" int kill(pid_t pid, int signal) noexcept {
    signalled.push_back(pid);
    return static_cast<int>(::syscall(SYS_kill, pid, signal));
}

namespace adminhost {
namespace {

using namespace std::chrono_literals;
using Reasons = std::vector<std::optional<std::string>>;

class PluginTrials : public testing::Test {
  protected:
    void SetUp() override { signalled.clear(); }
    void TearDown() override { std::signal(SIGCHLD, SIG_DFL); }
};

TEST_F(PluginTrials, TheGroupOfAChildIsKilledBeforeTheChildIsReaped) {
    EXPECT_EQ(tryPlugins({DiskPath("/good"), DiskPath("/bad")}), (Reasons{std::nullopt, "no"}));
    ASSERT_EQ(signalled.size(), 2U);
    for (const pid_t group : signalled) {
        EXPECT_LT(group, -1);
        EXPECT_EQ(::waitpid(-group, nullptr, 0), -1) << "it has been reaped";
    }
}

TEST_F(PluginTrials, AGroupWhoseChildWasReapedElsewhereIsNotSignalled) {
    std::signal(SIGCHLD, SIG_IGN);  // the kernel reaps
    EXPECT_EQ(tryPlugins({DiskPath("/good")}), Reasons{std::nullopt});
    EXPECT_EQ(signalled, std::vector<pid_t>()) << "the number may be another group's by now";
}

TEST_F(PluginTrials, AChildThatDoesNotFinishIsKilled) {
    const Reasons reasons = tryPlugins({DiskPath("/loops")}, 50ms);
    EXPECT_EQ(reasons, Reasons{"/loops did not finish loading in time and was ended; install another release of it"});
    EXPECT_EQ(signalled.size(), 1U);
}

}  // namespace
}  // namespace adminhost
