#include "platform/task/Task.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"

#include <chrono>
#include <csignal>
#include <filesystem>
#include <future>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace {

using adminhost::DiskPath;
using adminhost::launch_task;
using adminhost::launch_task_with_input_and_environment;
using adminhost::test::runProgram;
using adminhost::test::SampleRoot;
using adminhost::test::ToolCall;
using testing::ElementsAre;
using testing::HasSubstr;

const std::string setupPreferences = "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_preferences";
const std::string setupLibrary = "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_library";

class StandIns : public testing::Test {
  protected:
    int run(const std::string& tool, const std::vector<std::string>& arguments) {
        return launch_task(DiskPath(root.disk(tool)), arguments, &output, &error);
    }
    std::string camera(int id) { return chomp(root.sql("select uuid from cameras where id = " + std::to_string(id))); }
    std::string accessOf(int camera) {
        return root.sql(
            "select record_uuid from access_control_entries where resource_type = 'Camera' and resource_id = " +
            std::to_string(camera) + " order by id");
    }
    static std::string chomp(std::string line) {
        line.pop_back();
        return line;
    }
    std::vector<std::string> access(const std::string& command, int id, const std::string& type,
                                    const std::vector<std::string>& names) {
        std::vector<std::string> all{command,    "--resource_type", "camera", "--resource_uuid",
                                     camera(id), "--record_type",   type};
        for (const auto& name : names) {
            all.insert(all.end(), {"--shortname", name});
        }
        return all;
    }

    SampleRoot root;
    std::string output;
    std::string error;
};

TEST_F(StandIns, RecordTheirArgumentsOnlyWhenAskedTo) {
    EXPECT_EQ(run(setupPreferences, {}), 0);
    root.recordToolCalls();
    EXPECT_EQ(run(setupPreferences, {}), 0);
    EXPECT_EQ(run("/usr/bin/lumioconfig", {"--odd", "a \"b\"\\ 'c'\nd", "", "ä"}), 64);
    EXPECT_THAT(root.toolCalls(),
                ElementsAre(ToolCall{setupPreferences, {}, {}},
                            ToolCall{"/usr/bin/lumioconfig", {"--odd", "a \"b\"\\ 'c'\nd", "", "ä"}, {}}));
}

TEST_F(StandIns, SwitchesGiveOutputErrorAndStatusInsteadOfTheToolsWork) {
    root.setSwitch("lumioconfig.exit", "3\n");
    root.setSwitch("lumioconfig.output", "to the output\n");
    root.setSwitch("lumioconfig.error", "to the error\n");
    EXPECT_EQ(run("/usr/bin/lumioconfig", {"--remove_camera", camera(1)}), 3);
    EXPECT_EQ(output, "to the output\n");
    EXPECT_EQ(error, "to the error\n");
    EXPECT_EQ(root.sql("select count(*) from cameras"), "12\n");
    root.clearSwitches();
    EXPECT_EQ(run("/usr/bin/lumioconfig", {"--remove_camera", camera(1)}), 0);
}

TEST_F(StandIns, SwitchKillsTheToolByASignal) {
    root.setSwitch("setup_preferences.signal", "SEGV");
    EXPECT_EQ(run(setupPreferences, {}), 128 + SIGSEGV);
}

TEST_F(StandIns, HeldToolBeginsItsWorkWhenItIsReleased) {
    root.remove("/var/lumio");
    root.hold("setup_preferences");
    auto running = std::async(std::launch::async, [&] { return runProgram({root.disk(setupPreferences)}); });
    ASSERT_TRUE(root.waitForHeld("setup_preferences"));
    EXPECT_FALSE(std::filesystem::exists(root.disk("/var/lumio")));
    root.release("setup_preferences");
    EXPECT_EQ(running.get().status, 0);
    EXPECT_TRUE(std::filesystem::exists(root.disk("/var/lumio/server")));
}

TEST_F(StandIns, SwitchLeavesADaemonThatHoldsThePipes) {
    EXPECT_EQ(root.daemonLeftBy("setup_preferences"), std::nullopt);
    root.setSwitch("setup_preferences.daemon", "60");
    EXPECT_EQ(run(setupPreferences, {}), 0);
    const auto daemon = root.daemonLeftBy("setup_preferences");
    ASSERT_TRUE(daemon.has_value());
    EXPECT_THAT(std::filesystem::read_symlink("/proc/" + std::to_string(*daemon) + "/fd/1").string(),
                testing::StartsWith("pipe:"));
}

TEST_F(StandIns, SetupMakesTheDirectoriesThatAreMissing) {
    root.remove("/var/lumio");
    root.remove("/Library/Preferences");
    EXPECT_EQ(run(setupPreferences, {}), 0);
    EXPECT_TRUE(std::filesystem::is_directory(root.disk("/var/lumio/server")));
    EXPECT_TRUE(std::filesystem::is_directory(root.disk("/Library/Preferences")));
}

TEST_F(StandIns, LibrarySetupLaysOutTheSharedFileSystemThatThePreferencesName) {
    std::string preferences = root.read("/Library/Preferences/com.brenn.lumioserverd.plist");
    const std::string old = "/Library/SorvaneProducer/Shared";
    preferences.replace(preferences.find(old), old.size(), "/srv/elsewhere");
    root.write("/Library/Preferences/com.brenn.lumioserverd.plist", preferences);
    EXPECT_EQ(run(setupLibrary, {}), 0) << error;
    EXPECT_TRUE(std::filesystem::exists(root.disk("/srv/elsewhere/Server/Secrets/kek.plist")));
    EXPECT_TRUE(std::filesystem::exists(root.disk("/srv/elsewhere/lumioserverd.plist")));
    root.remove("/Library/Preferences/com.brenn.lumioserverd.plist");
    EXPECT_EQ(run(setupLibrary, {}), 1);
}

TEST_F(StandIns, LumioconfigAddsAccessRowsOnceAndRemovesThem) {
    const std::string ben = SampleRoot::uuidOf("user", "ben");
    const std::string carla = SampleRoot::uuidOf("user", "carla");
    const std::string staff = SampleRoot::uuidOf("group", "staff");
    EXPECT_EQ(run("/usr/bin/lumioconfig", access("--add_access", 3, "user", {"ben", "carla"})), 0) << error;
    EXPECT_EQ(run("/usr/bin/lumioconfig", access("--add_access", 3, "user", {"ben"})), 0) << error;
    EXPECT_EQ(run("/usr/bin/lumioconfig", access("--add_access", 3, "group", {"staff"})), 0) << error;
    EXPECT_EQ(accessOf(3), ben + "\n" + carla + "\n" + staff + "\n");
    EXPECT_EQ(run("/usr/bin/lumioconfig", access("--remove_access", 3, "user", {"ben"})), 0) << error;
    EXPECT_EQ(run("/usr/bin/lumioconfig", access("--remove_access", 3, "group", {"staff"})), 0) << error;
    EXPECT_EQ(accessOf(3), carla + "\n");
}

TEST_F(StandIns, LumioconfigChangesNothingForAPersonOrResourceThatIsNotThere) {
    EXPECT_EQ(run("/usr/bin/lumioconfig", access("--add_access", 3, "user", {"ben", "nobody-here"})), 2);
    EXPECT_THAT(error, HasSubstr("no user nobody-here"));
    EXPECT_EQ(accessOf(3), "");
    EXPECT_EQ(run("/usr/bin/lumioconfig", {"--remove_camera", "no-such-camera"}), 2);
}

TEST_F(StandIns, LumioconfigRemovesACameraWithItsAccessRows) {
    EXPECT_EQ(run("/usr/bin/lumioconfig", {"--remove_camera", camera(1)}), 0) << error;
    EXPECT_EQ(root.sql("select count(*) from cameras where id = 1"), "0\n");
    EXPECT_EQ(accessOf(1), "");
    EXPECT_NE(accessOf(2), "");
}

TEST_F(StandIns, LumioctlStartLeavesADaemonAndStopEndsIt) {
    EXPECT_EQ(run("/usr/sbin/lumioctl", {"server", "start"}), 0) << error;
    const pid_t daemon = std::stoi(root.read("/var/run/lumioserverd.pid"));
    EXPECT_EQ(::kill(daemon, 0), 0);
    EXPECT_EQ(run("/usr/sbin/lumioctl", {"server", "status"}), 0);
    EXPECT_EQ(run("/usr/sbin/lumioctl", {"server", "stop"}), 0) << error;
    EXPECT_EQ(run("/usr/sbin/lumioctl", {"server", "status"}), 3);
    EXPECT_FALSE(std::filesystem::exists(root.disk("/var/run/lumioserverd.pid")));
}

TEST_F(StandIns, NimboListsGridsOnlyWithAReadableTicketCache) {
    const std::vector<std::string> arguments{"-h", "grid1", "-auth", "Kerberos", "-f", "xml", "-grid", "list"};
    const DiskPath nimbo(root.disk("/usr/bin/nimbo"));
    root.recordToolCalls();
    root.write("/var/lumio/server/cc", "ticket");
    const std::map<std::string, std::string> good{{"KRB5CCNAME", "FILE:" + root.disk("/var/lumio/server/cc")}};
    EXPECT_EQ(launch_task_with_input_and_environment(nimbo, arguments, std::nullopt, &output, &error, good), 0)
        << error;
    EXPECT_THAT(output, HasSubstr("<key>gridList</key>"));
    EXPECT_THAT(root.toolCalls(), ElementsAre(ToolCall{"/usr/bin/nimbo", arguments, good}));
    EXPECT_EQ(launch_task_with_input_and_environment(nimbo, arguments, std::nullopt, &output, &error,
                                                     {{"KRB5CCNAME", "FILE:" + root.disk("/var/lumio/server/none")}}),
              10);
    EXPECT_EQ(output, "");
    EXPECT_EQ(launch_task_with_input_and_environment(nimbo, {"-h", "grid1"}, std::nullopt, &output, &error, good), 64);
}

TEST_F(StandIns, TheSqlToolIsTheRealOne) {
    EXPECT_EQ(run("/usr/bin/sqlite3", {"-line", root.databasePath(), "select count(*) from cameras"}), 0);
    EXPECT_EQ(output, "count(*) = 12\n");
}

TEST_F(StandIns, WritingOverTheSqlToolReplacesTheLinkNotTheRealTool) {
    const auto real = std::filesystem::read_symlink(root.disk("/usr/bin/sqlite3"));
    const auto size = std::filesystem::file_size(real);
    root.write("/usr/bin/sqlite3", "#!/bin/sh\n");
    EXPECT_FALSE(std::filesystem::is_symlink(root.disk("/usr/bin/sqlite3")));
    EXPECT_EQ(root.read("/usr/bin/sqlite3"), "#!/bin/sh\n");
    EXPECT_EQ(std::filesystem::file_size(real), size);
}

}  // namespace
