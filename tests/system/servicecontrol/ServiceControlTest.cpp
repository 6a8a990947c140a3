// Starting and stopping the service through daemon, plug-in, control tool and service manager: a real systemd if the
// test runs as root, else a mock.

#include "platform/json/Json.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Eventually.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"
#include "tests/support/ServiceManager.h"

#include <filesystem>
#include <optional>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;

constexpr const char* unit = "com.brenn.lumioserverd.service";
constexpr const char* serviceUnit = "lumioserverd.service";
constexpr const char* daemonUnit = "adminhostd.service";

class ServiceControl : public testing::Test {
  protected:
    static void SetUpTestSuite() {
        addUnit(serviceUnit, "[Unit]\nDefaultDependencies=no\n[Service]\nExecStart=/bin/sleep 1000\n");
        addUnitAlias(serviceUnit, unit);
    }
    void SetUp() override {
        // The service's control tool asks the service manager.
        const std::string ask =
            isRealServiceManager()
                ? std::string("exec /usr/bin/systemctl \"$2\" ") + unit
                : std::string(
                      "case $2 in start) verb=StartUnit ;; *) verb=StopUnit ;; esac\n"
                      "exec /usr/bin/busctl --address=\"$DBUS_SYSTEM_BUS_ADDRESS\" call "
                      "org.freedesktop.systemd1 /org/freedesktop/systemd1 org.freedesktop.systemd1.Manager "
                      "$verb ss ") +
                      unit + " replace";
        root.write("/usr/sbin/lumioctl", "#!/bin/sh\n[ \"$1\" = server ] || exit 64\n" + ask + "\n");
        fs::permissions(root.disk("/usr/sbin/lumioctl"), fs::perms(0755));
        root.remove("/var/lumio/server/.lumio_setup_done");
        fs::create_directory(root.directory() + "/daemon");
        stopService();
    }
    void TearDown() override { stopService(); }

    static void stopService() {
        stopUnit(unit);
        ASSERT_TRUE(reachState(unit, "inactive"));
    }
    [[nodiscard]] DaemonProcess::Options options() const {
        return {{"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"},
                "service_manager = \"systemd\"\n",
                {},
                true,
                {}};
    }
    [[nodiscard]] static std::string stateFrom(UnixHttp client) {
        const HttpReply reply = client.post("/v1/lumio/getState");
        const auto answer = parseJson(reply.body);
        return answer && answer->dictionary() != nullptr ? std::string(answer->dictionary()->text("state"))
                                                         : reply.body;
    }

    const SampleRoot root;
};

TEST_F(ServiceControl, StartAndStopReachTheServiceManagerAndTheStateFollows) {
    const DaemonProcess daemon(options());
    EXPECT_EQ(stateFrom(daemon.connect()), "STOPPED");

    const HttpReply started = daemon.connect().post("/v1/lumio/startService");
    EXPECT_EQ(started.status, 204) << started.body;
    EXPECT_TRUE(fs::exists(root.disk("/var/lumio/server/.lumio_setup_done")));
    EXPECT_EQ(stateFrom(daemon.connect()), "RUNNING");
    EXPECT_THAT(daemon.connect().get("/v1/requests/" + started.headers.at("request-id")).body,
                testing::AllOf(HasSubstr("running lumioctl server start"), HasSubstr("start result: 0")));

    const HttpReply stopped = daemon.connect().post("/v1/lumio/stopService", R"({"variant":"withDetails"})");
    EXPECT_EQ(stopped.status, 200) << stopped.body;
    EXPECT_THAT(stopped.body, testing::AllOf(HasSubstr(R"("state":"STOPPED")"), HasSubstr("totalCameras")));
    EXPECT_EQ(stateFrom(daemon.connect()), "STOPPED");
    EXPECT_THAT(daemon.connect().get("/v1/lumio/history").body,
                testing::AllOf(HasSubstr("startService"), HasSubstr("stopService"), HasSubstr("lumioserverd")));
}

TEST_F(ServiceControl, ControlToolThatFailsIsAnErrorResponse) {
    root.write("/usr/sbin/lumioctl", "#!/bin/sh\nexit 3\n");
    const DaemonProcess daemon(options());
    const HttpReply started = daemon.connect().post("/v1/lumio/startService");
    EXPECT_THAT(started.body, HasSubstr("CANNOT_START_SERVICE_ERR"));
    EXPECT_FALSE(fs::exists(root.disk("/var/lumio/server/.lumio_setup_done")));
    EXPECT_THAT(daemon.connect().post("/v1/lumio/stopService").body, HasSubstr("CANNOT_STOP_SERVICE_ERR"));
    EXPECT_EQ(stateFrom(daemon.connect()), "STOPPED");
}

/// With a real service manager the daemon is a unit too, whose restart ends every process of its control group.
TEST_F(ServiceControl, StartedServiceLivesOnWhenTheDaemonIsRestarted) {
    const std::string socket = root.directory() + "/daemon/socket";
    std::optional<DaemonProcess> process;
    if (isRealServiceManager()) {
        root.write("/etc/adminhostd.toml", "service_manager = \"systemd\"\n");
        addUnit(daemonUnit, "[Unit]\nDefaultDependencies=no\n[Service]\nExecStart=" + std::string(BINARY_DIR) +
                                "/bin/adminhostd --root " + root.path() + " --socket " + socket + " --config " +
                                root.disk("/etc/adminhostd.toml") + " --plugin " + BINARY_DIR +
                                "/lib/adminhost_lumio.so --log stderr\n");
        startUnit(daemonUnit);
    } else {
        process.emplace(options());
    }
    const auto client = [&] { return process ? process->connect() : UnixHttp(socket); };
    ASSERT_TRUE(eventually([&] { return process || fs::exists(socket); }));
    ASSERT_EQ(client().post("/v1/lumio/startService").status, 204);
    ASSERT_EQ(stateFrom(client()), "RUNNING");
    const auto mainPid = [] {
        return runProgram({"systemctl", "show", "--property=MainPID", "--value", serviceUnit}).output;
    };
    const std::string before = isRealServiceManager() ? mainPid() : "";

    if (process) {
        process.reset();
        process.emplace(options());
    } else {
        ASSERT_EQ(runProgram({"systemctl", "stop", daemonUnit}).status, 0);
        ASSERT_TRUE(reachState(daemonUnit, "inactive"));
        startUnit(daemonUnit);
        ASSERT_TRUE(eventually([&] { return fs::exists(socket); }));
        EXPECT_EQ(mainPid(), before);
    }
    EXPECT_EQ(stateFrom(client()), "RUNNING");
    if (isRealServiceManager()) {
        EXPECT_EQ(runProgram({"systemctl", "stop", daemonUnit}).status, 0);
    }
}

}  // namespace
}  // namespace adminhost::test

int main(int argc, char** argv) {
    adminhost::test::enterServiceManager(argc, argv);
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
