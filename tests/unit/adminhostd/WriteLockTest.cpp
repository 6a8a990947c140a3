#include "adminhostd/WriteLock.h"
#include "platform/task/Task.h"
#include "tests/support/TemporaryRoot.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <string>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;

class Lock : public testing::Test {
  protected:
    [[nodiscard]] fs::path directory() const { return _root.path("/run/adminhostd/private"); }
    [[nodiscard]] fs::path file() const { return directory() / "write.lock"; }

    test::TemporaryRoot _root;
};

TEST_F(Lock, IsAPrivateFileInADirectoryThatOnlyTheAccountCanEnterBelowTheRoot) {
    const mode_t mask = ::umask(0);
    const auto held = WriteLock::tryToHold();
    ::umask(mask);
    ASSERT_TRUE(held);
    struct stat status {};
    ASSERT_EQ(::stat(file().c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0600U);
    ASSERT_EQ(::stat(directory().c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0700U);
    ASSERT_EQ(::stat(_root.path("/run/adminhostd").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0755U) << "clients enter it for the socket";
}

TEST_F(Lock, ASecondHolderIsRefusedWithTheFirstOnesProcessId) {
    const auto held = WriteLock::tryToHold();
    ASSERT_TRUE(held);
    const auto second = WriteLock::tryToHold();
    ASSERT_FALSE(second);
    EXPECT_EQ(second.error().domain, WriteLock::busy);
    EXPECT_EQ(second.error().description,
              "Another process (" + std::to_string(::getpid()) + ") is changing something and has not finished.");
}

TEST_F(Lock, IsFreeAgainAfterItsHolderHasGoneOrDied) {
    for (int i = 0; i < 3; ++i) {
        EXPECT_TRUE(WriteLock::tryToHold());
    }
    const pid_t child = ::fork();
    if (child == 0) {
        const auto held = WriteLock::tryToHold();
        ::raise(SIGKILL);
    }
    ASSERT_EQ(::waitpid(child, nullptr, 0), child);
    EXPECT_TRUE(WriteLock::tryToHold());
}

TEST_F(Lock, AToolThatStaysDoesNotHoldIt) {
    std::string output;
    {
        const auto held = WriteLock::tryToHold();
        ASSERT_TRUE(held);
        EXPECT_EQ(launch_task(DiskPath("/bin/sh"), {"-c", "sleep 300 >/dev/null 2>&1 & echo $!"}, &output, nullptr), 0);
    }
    EXPECT_TRUE(WriteLock::tryToHold());
    ::kill(static_cast<pid_t>(std::stol(output)), SIGKILL);
}

TEST_F(Lock, ADirectoryThatOthersCanEnterIsClosedToThem) {
    fs::create_directories(directory());
    fs::permissions(directory(), fs::perms::all);
    EXPECT_TRUE(WriteLock::tryToHold());
    EXPECT_EQ(fs::status(directory()).permissions(), fs::perms::owner_all);
}

TEST_F(Lock, ALinkInItsPlaceIsNotFollowed) {
    fs::create_directories(directory());
    fs::create_symlink(_root.path("/elsewhere"), file());
    const auto held = WriteLock::tryToHold();
    ASSERT_FALSE(held);
    EXPECT_EQ(held.error().domain, "posix");
    EXPECT_EQ(held.error().description,
              "The lock for changes " + file().string() + " cannot be used: Too many levels of symbolic links.");
    EXPECT_FALSE(fs::exists(_root.path("/elsewhere")));
}

TEST_F(Lock, ADirectoryOfAnotherAccountIsNotUsed) {
    fs::create_directories(directory());
    if (::chown(directory().c_str(), 65534, 65534) != 0) {
        ASSERT_NE(::geteuid(), 0U) << "only root can give it away";
        fs::remove(directory());
        fs::create_symlink("/", directory());  // a link to root's directory
    }
    const auto held = WriteLock::tryToHold();
    ASSERT_FALSE(held);
    EXPECT_EQ(held.error().domain, "posix");
}

}  // namespace
}  // namespace adminhost
