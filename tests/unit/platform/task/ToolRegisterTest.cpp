#include "platform/task/Task.h"
#include "platform/task/TaskGroup.h"
#include "platform/task/ToolRegister.h"

#include <cerrno>
#include <csignal>
#include <set>
#include <string>
#include <vector>

#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/mman.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace adminhost;

class Register : public testing::Test {
  protected:
    void SetUp() override {
        ASSERT_TRUE(_register);
        setToolRegister(&*_register);
    }
    void TearDown() override { setToolRegister(nullptr); }

    /// The ids in the register, read as another process does.
    [[nodiscard]] std::multiset<pid_t> ids() const {
        std::vector<pid_t> numbers(ToolRegister::capacity);
        const auto bytes = static_cast<ssize_t>(numbers.size() * sizeof(pid_t));
        EXPECT_EQ(::pread(_register->descriptor(), numbers.data(), static_cast<std::size_t>(bytes), 0), bytes);
        std::multiset<pid_t> found(numbers.begin(), numbers.end());
        found.erase(0);
        return found;
    }

    Result<ToolRegister> _register = ToolRegister::create();
};

pid_t pidIn(const TaskResult& result) {
    return static_cast<pid_t>(std::stol(result.output));
}

TEST_F(Register, HoldsAToolFromItsStartUntilItsExitIsSeen) {
    TaskGroup group;
    const auto first = group.start({DiskPath("/bin/sh"), {"-c", "echo $$; read line"}, "\n"});
    const auto second = group.start({DiskPath("/bin/sh"), {"-c", "echo $$; sleep 300 & exit 0"}});
    EXPECT_EQ(ids().size(), 2U);
    const TaskResult firstResult = group.collect(first);
    EXPECT_FALSE(ids().contains(pidIn(firstResult)));
    const TaskResult secondResult = group.collect(second);
    EXPECT_TRUE(ids().empty());
    ::kill(-pidIn(secondResult), SIGKILL);
}

TEST_F(Register, HoldsNoToolThatCouldNotBeStarted) {
    EXPECT_EQ(launch_task(DiskPath("/missing"), {}, nullptr, nullptr), -1);
    EXPECT_EQ(launch_task(DiskPath("relative"), {}, nullptr, nullptr), -1);
    EXPECT_TRUE(ids().empty());
}

TEST_F(Register, AToolThatFindsNoFreePlaceIsNotStarted) {
    for (std::size_t i = 0; i < ToolRegister::capacity; ++i) {
        ASSERT_NE(_register->claim(), nullptr);
    }
    std::string error;
    EXPECT_EQ(launch_task(DiskPath("/bin/true"), {}, nullptr, &error), -1);
    EXPECT_EQ(error, "/bin/true: Resource temporarily unavailable");
    // Claimed places without an id do not name processes.
    _register->killRemaining();
    EXPECT_TRUE(ids().empty());
    EXPECT_EQ(launch_task(DiskPath("/bin/true"), {}, nullptr, nullptr), 0);
}

TEST_F(Register, KillingTheRestSparesAGroupThatItsFirstProcessDoesNotLeadAnyMore) {
    const pid_t bystander = ::fork();  // in our group
    if (bystander == 0) {
        ::pause();
        ::_exit(0);
    }
    _register->claim()->store(bystander);
    _register->claim()->store(1);
    _register->killRemaining();
    int status = 0;
    EXPECT_EQ(::waitpid(bystander, &status, WNOHANG), 0);
    ::kill(bystander, SIGKILL);
    EXPECT_EQ(::waitpid(bystander, &status, 0), bystander);
}

TEST_F(Register, CannotBeMadeSmallerOrLargerByTheOtherProcess) {
    EXPECT_EQ(::ftruncate(_register->descriptor(), 0), -1);
    EXPECT_EQ(::ftruncate(_register->descriptor(), 1 << 20), -1);
}

TEST_F(Register, AnotherFileIsNotOpenedAsARegister) {
    const auto wrong = ToolRegister::open(FileDescriptor(::open("/dev/null", O_RDWR | O_CLOEXEC)));
    ASSERT_FALSE(wrong);
    EXPECT_EQ(wrong.error().code, EINVAL);
    EXPECT_FALSE(ToolRegister::open(FileDescriptor(-1)));
}

}  // namespace
