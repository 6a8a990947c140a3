#include "platform/files/Path.h"
#include "platform/service/ServiceState.h"
#include "tests/support/TemporaryRoot.h"

#include <chrono>
#include <csignal>
#include <ctime>
#include <string>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr std::string_view pidFile = "/var/run/exampled.pid";
const HostPath jobFile("/System/Library/LaunchDaemons/org.example.exampled.plist");

/// A child process that waits, or one that has ended and was not collected.
class Child {
  public:
    explicit Child(bool ends = false) : _pid(::fork()) {
        if (_pid == 0) {
            if (!ends) {
                ::pause();
            }
            ::_exit(0);
        }
        if (ends) {
            siginfo_t information{};
            ::waitid(P_PID, static_cast<id_t>(_pid), &information, WEXITED | WNOWAIT);
        }
    }
    Child(const Child&) = delete;
    Child& operator=(const Child&) = delete;
    ~Child() { end(); }

    void end() {
        if (_pid > 0) {
            ::kill(_pid, SIGKILL);
            ::waitpid(_pid, nullptr, 0);
            _pid = 0;
        }
    }
    [[nodiscard]] std::string text() const { return std::to_string(_pid); }

  private:
    pid_t _pid;
};

class PidFile : public testing::Test {
  protected:
    void SetUp() override { setServiceManager(ServiceManager::pidFile); }

    void writtenAt(std::chrono::seconds fromNow) const {
        const timespec time{std::time(nullptr) + fromNow.count(), 0};
        const timespec times[2] = {time, time};
        ASSERT_EQ(::utimensat(AT_FDCWD, root.path(pidFile).c_str(), times, 0), 0);
    }

    test::TemporaryRoot root;
};

TEST(ServiceUnit, IsNamedByTheJobFileWithoutItsExtension) {
    EXPECT_EQ(unitOf(HostPath("/System/Library/LaunchDaemons/com.brenn.lumioserverd.plist")),
              "com.brenn.lumioserverd.service");
    EXPECT_EQ(unitOf(HostPath("single")), "single.service");
    EXPECT_EQ(unitOf(HostPath("/a.b/single")), "single.service");
}

TEST_F(PidFile, IsTheDefaultBelowASystemRoot) {
    EXPECT_EQ(defaultServiceManager(), ServiceManager::pidFile);
}

TEST_F(PidFile, OfRunningProcessMeansRunning) {
    const Child child;
    root.write(pidFile, child.text() + "\n");
    EXPECT_TRUE(GetLaunchDaemonServiceState(jobFile));
    root.write(pidFile, child.text());
    EXPECT_TRUE(GetLaunchDaemonServiceState(jobFile));
}

TEST_F(PidFile, IsReadBelowTheSystemRoot) {
    const Child child;
    EXPECT_FALSE(GetLaunchDaemonServiceState(jobFile));
    root.write(pidFile, child.text());
    EXPECT_TRUE(GetLaunchDaemonServiceState(jobFile));
}

TEST_F(PidFile, OfEndedProcessMeansNotRunning) {
    Child child;
    root.write(pidFile, child.text());
    child.end();
    const auto result = serviceIsRunning(jobFile);
    ASSERT_TRUE(result);
    EXPECT_FALSE(*result);
}

TEST_F(PidFile, OfZombieMeansNotRunning) {
    const Child child(true);
    root.write(pidFile, child.text());
    EXPECT_FALSE(GetLaunchDaemonServiceState(jobFile));
}

TEST_F(PidFile, OlderThanItsProcessMeansNotRunning) {
    const Child child;
    root.write(pidFile, child.text());
    writtenAt(std::chrono::seconds(-2));
    EXPECT_FALSE(GetLaunchDaemonServiceState(jobFile)) << "the process id was used again";
    writtenAt(std::chrono::seconds(1));
    EXPECT_TRUE(GetLaunchDaemonServiceState(jobFile));
}

TEST_F(PidFile, ThatIsMissingMeansNotRunningWithoutAnError) {
    const auto result = serviceIsRunning(jobFile);
    ASSERT_TRUE(result);
    EXPECT_FALSE(*result);
}

TEST_F(PidFile, WithoutAProcessIdIsAnErrorAndNotRunning) {
    for (const char* text : {"", "\n", "x", "12 13", "-1", "0", "99999999999999999999", "1x"}) {
        root.write(pidFile, text);
        const auto result = serviceIsRunning(jobFile);
        ASSERT_FALSE(result) << text;
        EXPECT_EQ(result.error().description, "/var/run/exampled.pid does not hold a process id");
        EXPECT_FALSE(GetLaunchDaemonServiceState(jobFile));
    }
}

}  // namespace
}  // namespace adminhost
