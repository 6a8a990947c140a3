#include "adminhostd/UnitProcesses.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>
#include <string>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

/// A picture of the kernel's files: the front is 100, its worker 101, and a tool of the worker 102.
class UnitProcessesTest : public ::testing::Test {
  protected:
    UnitProcessesTest() {
        root.write("/proc/100/cgroup", "0::/system.slice/adminhostd.service\n");
        process(100, "adminhostd", 1);
        process(101, "adminhostd-work", 100);
        process(102, "a (b) c", 101);
        members("100\n101\n102\n");
    }

    void process(int pid, const std::string& name, int parent) const {
        root.write("/proc/" + std::to_string(pid) + "/stat",
                   std::to_string(pid) + " (" + name + ") S " + std::to_string(parent) + " 1 1 0");
    }
    void members(const std::string& pids) const {
        root.write("/cgroup/system.slice/adminhostd.service/cgroup.procs", pids);
    }
    [[nodiscard]] UnitProcesses found(const std::string& mainProcess = "100") const {
        return unitProcesses(100, mainProcess, {root.path("/proc").string(), root.path("/cgroup").string()});
    }

    const test::TemporaryRoot root;
};

TEST_F(UnitProcessesTest, DaemonAndItsDescendantsAreNoStrays) {
    EXPECT_EQ(found().unit, "adminhostd.service");
    EXPECT_TRUE(found().strays.empty());
}

TEST_F(UnitProcessesTest, ServiceThatAControlToolLeftInTheUnitIsAStray) {
    process(200, "a daemon)", 1);
    members("100\n101\n200\n");
    ASSERT_EQ(found().strays.size(), 1U);
    EXPECT_EQ(found().strays[0].pid, 200);
    EXPECT_EQ(found().strays[0].name, "a daemon)");
}

TEST_F(UnitProcessesTest, ProcessThatHasJustEndedIsNoStray) {
    members("100\n300\n");
    EXPECT_TRUE(found().strays.empty());
}

TEST_F(UnitProcessesTest, FileThatIsOpenedAndCannotBeReadIsEmpty) {
    // A process that ends between the two fails the same way, and any client's may.
    std::filesystem::create_directories(root.path("/proc/300/cgroup"));
    EXPECT_EQ(controlGroupOf(300, {root.path("/proc").string(), root.path("/cgroup").string()}), "");
}

TEST_F(UnitProcessesTest, GroupThatIsNotAServiceOfTheManagerIsNotJudged) {
    process(200, "shell", 1);
    root.write("/proc/100/cgroup", "0::/user.slice/session-1.scope\n");
    root.write("/cgroup/user.slice/session-1.scope/cgroup.procs", "100\n200\n");
    EXPECT_EQ(found().unit, "");
    EXPECT_TRUE(found().strays.empty());
}

TEST_F(UnitProcessesTest, UnitOfAnotherMainProcessIsNotJudged) {
    process(200, "shell", 1);
    members("100\n200\n");
    EXPECT_EQ(found("").unit, "");
    EXPECT_EQ(found("99").unit, "");
    EXPECT_TRUE(found("99").strays.empty());
}

TEST_F(UnitProcessesTest, GroupOfTheOlderHierarchyIsFound) {
    root.write("/proc/100/cgroup", "5:memory:/x\n1:name=systemd:/system.slice/adminhostd.service\n0::/\n");
    root.write("/cgroup/systemd/system.slice/adminhostd.service/cgroup.procs", "100\n200\n");
    members("");
    process(200, "stray", 1);
    EXPECT_EQ(found().strays.size(), 1U);
}

}  // namespace
}  // namespace adminhost
