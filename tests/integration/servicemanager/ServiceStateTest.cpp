// The state of a service as the service manager has it: with a real systemd if the test runs as root, else with a mock.

#include "platform/files/Path.h"
#include "platform/service/ServiceState.h"
#include "tests/support/Environment.h"
#include "tests/support/ServiceManager.h"

#include <array>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost {
namespace {

using support::ScopedEnvironment;
using test::addUnit;
using test::reachState;
using test::startUnit;
using testing::HasSubstr;

/// The environment in which the system bus has this address.
ScopedEnvironment::Changes busAt(const std::string& address) {
    return {{"DBUS_SYSTEM_BUS_ADDRESS", address}};
}

HostPath jobFileOf(const std::string& unit) {
    return HostPath("/System/Library/LaunchDaemons/" + unit.substr(0, unit.rfind('.')) + ".plist");
}

std::string unitThat(const std::string& service) {
    return "[Unit]\nDefaultDependencies=no\n[Service]\n" + service + '\n';
}

/// A unit of this name reaches the state, and its service is, or is not, running.
void expectInState(const std::string& unit, const std::string& state, bool isRunning) {
    ASSERT_TRUE(reachState(unit, state)) << unit << " does not become " << state;
    const auto result = serviceIsRunning(jobFileOf(unit));
    ASSERT_TRUE(result) << result.error().description.value_or("");
    EXPECT_EQ(*result, isRunning) << state;
    EXPECT_EQ(GetLaunchDaemonServiceState(jobFileOf(unit)), isRunning) << state;
}

class ServiceState : public testing::Test {
  protected:
    void SetUp() override { setServiceManager(ServiceManager::systemd); }
};

TEST_F(ServiceState, SystemdIsTheDefaultWhereItIsTheMachinesServiceManager) {
    // The mock has only its name on the bus.
    EXPECT_EQ(defaultServiceManager(),
              test::isRealServiceManager() ? ServiceManager::systemd : ServiceManager::pidFile);
    setSystemRoot("/tmp");
    EXPECT_EQ(defaultServiceManager(), ServiceManager::pidFile);
    setSystemRoot("/");
}

TEST_F(ServiceState, ActiveUnitIsRunningAndStoppedOneIsNot) {
    addUnit("org.example.plain.service", unitThat("ExecStart=/bin/sleep 1000"));
    expectInState("org.example.plain.service", "inactive", false);
    startUnit("org.example.plain.service");
    expectInState("org.example.plain.service", "active", true);
    test::stopUnit("org.example.plain.service");
    expectInState("org.example.plain.service", "inactive", false);
}

TEST_F(ServiceState, ReloadingUnitIsRunning) {
    addUnit("org.example.reloading.service", unitThat("ExecStart=/bin/sleep 1000\nExecReload=/bin/sleep 1000"));
    startUnit("org.example.reloading.service");
    expectInState("org.example.reloading.service", "active", true);
    test::reloadUnit("org.example.reloading.service");
    expectInState("org.example.reloading.service", "reloading", true);
}

TEST_F(ServiceState, UnitThatIsBeingStoppedIsRunningStill) {
    addUnit("org.example.stopping.service", unitThat("ExecStart=/bin/sleep 1000\nExecStop=/bin/sleep 1000"));
    startUnit("org.example.stopping.service");
    expectInState("org.example.stopping.service", "active", true);
    test::stopUnit("org.example.stopping.service");
    expectInState("org.example.stopping.service", "deactivating", true);
}

TEST_F(ServiceState, UnitThatIsBeingStartedIsNotRunningYet) {
    addUnit("org.example.starting.service", unitThat("ExecStartPre=/bin/sleep 1000\nExecStart=/bin/sleep 1000"));
    startUnit("org.example.starting.service");
    expectInState("org.example.starting.service", "activating", false);
}

TEST_F(ServiceState, FailedUnitIsNotRunning) {
    addUnit("org.example.failed.service", unitThat("ExecStart=/bin/false"));
    startUnit("org.example.failed.service");
    expectInState("org.example.failed.service", "failed", false);
}

TEST_F(ServiceState, UnitIsFoundUnderItsAlias) {
    addUnit("worker.service", unitThat("ExecStart=/bin/sleep 1000"));
    test::addUnitAlias("worker.service", "org.example.alias.service");
    startUnit("org.example.alias.service");
    expectInState("org.example.alias.service", "active", true);
}

TEST_F(ServiceState, UnitThatIsNotKnownIsNotRunning) {
    EXPECT_FALSE(GetLaunchDaemonServiceState(HostPath("/System/Library/LaunchDaemons/org.example.unknown.plist")));
    EXPECT_FALSE(GetLaunchDaemonServiceState(HostPath("")));
    EXPECT_FALSE(GetLaunchDaemonServiceState(HostPath("/a directory/not a unit's name.plist")));
}

TEST_F(ServiceState, MissingBusIsAnErrorAndNotRunning) {
    const ScopedEnvironment scoped(busAt("unix:path=/nonexistent/bus"));
    const auto result = serviceIsRunning(jobFileOf("org.example.plain.service"));
    ASSERT_FALSE(result);
    EXPECT_THAT(result.error().description.value_or(""),
                HasSubstr("cannot connect to the system bus: No such file or directory"));
    EXPECT_FALSE(GetLaunchDaemonServiceState(jobFileOf("org.example.plain.service")));
}

TEST_F(ServiceState, BusWithoutServiceManagerIsAnErrorAndNotRunning) {
    const ScopedEnvironment scoped(busAt(std::getenv("EMPTY_BUS_ADDRESS")));
    const auto result = serviceIsRunning(jobFileOf("org.example.plain.service"));
    ASSERT_FALSE(result);
    EXPECT_THAT(result.error().description.value_or(""), HasSubstr("org.freedesktop.systemd1"));
    EXPECT_FALSE(GetLaunchDaemonServiceState(jobFileOf("org.example.plain.service")));
}

/// The wait for a silent bus is bounded to two seconds; the margin is for a loaded machine.
TEST_F(ServiceState, BusThatAcceptsAndNeverRepliesIsGivenUpAfterTwoSeconds) {
    std::string directory = (std::filesystem::temp_directory_path() / "silent.XXXXXX").string();
    ASSERT_NE(::mkdtemp(directory.data()), nullptr);
    const std::string path = directory + "/bus";
    const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
    ASSERT_EQ(::bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    ASSERT_EQ(::listen(listener, 4), 0);
    {
        const ScopedEnvironment scoped(busAt("unix:path=" + path));
        const auto start = std::chrono::steady_clock::now();
        const auto result = serviceIsRunning(jobFileOf("org.example.plain.service"));
        const auto taken = std::chrono::steady_clock::now() - start;
        ASSERT_FALSE(result);
        EXPECT_THAT(result.error().description.value_or(""), HasSubstr("timed out"));
        EXPECT_GE(taken, std::chrono::milliseconds(1900));
        EXPECT_LT(taken, std::chrono::seconds(10));
    }
    ::close(listener);
    std::filesystem::remove_all(directory);
}

}  // namespace
}  // namespace adminhost

int main(int argc, char** argv) {
    adminhost::test::enterServiceManager(argc, argv);
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
