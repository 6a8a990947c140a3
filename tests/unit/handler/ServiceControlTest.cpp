#include "tests/unit/handler/StateFixture.h"

namespace lumio {
namespace {

namespace fs = std::filesystem;
using adminhost::Dictionary;
using adminhost::Response;
using adminhost::Value;
using testing::ElementsAre;
using testing::IsEmpty;

using ServiceControl = StateTest;

adminhost::Change changeTo(std::string_view state) {
    return {"service", "", "lumioserverd", "state", nullptr, state, false, nullptr};
}

TEST_F(ServiceControl, StartRunsTheControlToolMarksTheServiceAndReturnsNothing) {
    EXPECT_EQ(handler.startServiceWithVariant("withDetails").kind(), Response::Kind::nothing);
    EXPECT_EQ(calls(), "/usr/sbin/lumioctl server start\n");
    EXPECT_TRUE(fs::exists(root.path(marker)));
    EXPECT_THAT(log.lines,
                ElementsAre("adminhost_lumio: running lumioctl server start", "adminhost_lumio: start result: 0"));
    EXPECT_THAT(reports.changes, ElementsAre(changeTo("RUNNING")));
}

TEST_F(ServiceControl, StartThatFailsIsAnErrorAndMarksNothing) {
    record(controlTool, 3);
    const Response response = handler.startServiceWithVariant(nullptr);
    EXPECT_EQ(response.kind(), Response::Kind::error);
    EXPECT_EQ(response.dictionary().get("error"), Value("CANNOT_START_SERVICE_ERR"));
    EXPECT_FALSE(fs::exists(root.path(marker)));
    EXPECT_THAT(log.lines,
                ElementsAre("adminhost_lumio: running lumioctl server start", "adminhost_lumio: start result: 3"));
    EXPECT_THAT(reports.changes, IsEmpty());
}

TEST_F(ServiceControl, ControlToolThatIsMissingOrKilledFails) {
    fs::remove(root.path(controlTool));
    EXPECT_EQ(handler.startServiceWithVariant(nullptr).dictionary().get("error"), Value("CANNOT_START_SERVICE_ERR"));
    EXPECT_EQ(log.lines.back(), "adminhost_lumio: start result: -1");
    EXPECT_EQ(handler.stopServiceWithVariant(nullptr).dictionary().get("error"), Value("CANNOT_STOP_SERVICE_ERR"));
    EXPECT_EQ(log.lines.back(), "adminhost_lumio: stop result: -1");
    root.writeTool(controlTool, "#!/bin/sh\nkill -KILL $$\n");
    static_cast<void>(handler.startServiceWithVariant(nullptr));
    EXPECT_EQ(log.lines.back(), "adminhost_lumio: start result: 137");
}

TEST_F(ServiceControl, StopRunsTheControlToolAndReturnsTheStateWithoutDetails) {
    const Response response = handler.stopServiceWithVariant(nullptr);
    EXPECT_EQ(response.kind(), Response::Kind::dictionary);
    EXPECT_EQ(response.dictionary(), base("STOPPED"));
    EXPECT_EQ(calls(), "/usr/sbin/lumioctl server stop\n");
    EXPECT_THAT(log.lines,
                ElementsAre("adminhost_lumio: running lumioctl server stop", "adminhost_lumio: stop result: 0"));
    EXPECT_THAT(reports.changes, ElementsAre(changeTo("STOPPED")));
    EXPECT_FALSE(fs::exists(root.path(marker)));
}

TEST_F(ServiceControl, StopWithDetailsReturnsThem) {
    EXPECT_TRUE(handler.stopServiceWithVariant("withDetails").dictionary().contains("nimboControllerState"));
    EXPECT_FALSE(handler.stopServiceWithVariant("other").dictionary().contains("nimboControllerState"));
    EXPECT_FALSE(handler.stopServiceWithVariant(5).dictionary().contains("nimboControllerState"));
}

TEST_F(ServiceControl, StopSaysStoppedEvenIfTheServiceIsSeenRunningAndChangesNoOtherKey) {
    run();
    startupStatus("<integer>7</integer>");
    const Dictionary answer = handler.stopServiceWithVariant("withDetails").dictionary();
    EXPECT_EQ(answer.get("state"), Value("STOPPED"));
    EXPECT_EQ(keysOf(answer).front(), "state");
    EXPECT_EQ(answer.get("migrationStatus"), Value(7));
    EXPECT_TRUE(answer.contains("startTime"));
}

TEST_F(ServiceControl, StopThatFailsIsAnError) {
    record(controlTool, 1);
    const Response response = handler.stopServiceWithVariant("withDetails");
    EXPECT_EQ(response.kind(), Response::Kind::error);
    EXPECT_EQ(response.dictionary().get("error"), Value("CANNOT_STOP_SERVICE_ERR"));
    EXPECT_THAT(reports.changes, IsEmpty());
}

TEST_F(ServiceControl, RecycleDoesNothing) {
    EXPECT_EQ(handler.recycleServiceWithVariant("withDetails").kind(), Response::Kind::nothing);
    EXPECT_EQ(calls(), "");
    EXPECT_THAT(log.lines, IsEmpty());
    EXPECT_THAT(reports.changes, IsEmpty());
}

}  // namespace
}  // namespace lumio
