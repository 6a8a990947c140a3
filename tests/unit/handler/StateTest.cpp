#include "tests/unit/handler/StateFixture.h"

#include <ctime>

#include <sys/stat.h>
#include <sys/statvfs.h>

namespace lumio {
namespace {

namespace fs = std::filesystem;
using adminhost::Dictionary;
using adminhost::Value;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;

using State = StateTest;
using StateDetails = StateTest;

// The four rows of the state table.

TEST_F(State, RunningWithoutAStartupStatusFileIsRunning) {
    run();
    EXPECT_EQ(state(), base("RUNNING"));
}

TEST_F(State, RunningWithoutAnErrorInTheStartupStatusFileIsRunning) {
    run();
    startupStatus("<integer>0</integer>");
    EXPECT_EQ(state(), base("RUNNING"));
    root.writePropertyList(statusFile, "<key>other</key><integer>5</integer>");
    EXPECT_EQ(state(), base("RUNNING"));
}

TEST_F(State, RunningWithAnErrorIsRunningWithIssue) {
    run();
    startupStatus("<integer>7</integer>");
    Dictionary expected = base("RUNNING_WITH_ISSUE");
    expected.set("migrationStatus", 7);
    EXPECT_EQ(state(), expected);
    EXPECT_THAT(keysOf(state()),
                ElementsAre("state", "readWriteSettingsVersion", "setStateVersion", "migrationStatus"));
}

TEST_F(State, NotRunningIsStoppedWhateverTheStartupStatusFileHolds) {
    startupStatus("<integer>7</integer>");
    EXPECT_EQ(state(), base("STOPPED"));
    const Dictionary all = details();
    EXPECT_EQ(all.get("state"), Value("STOPPED"));
    EXPECT_FALSE(all.contains("migrationStatus"));
}

TEST_F(State, StartupStatusFileThatCannotBeReadIsLikeNone) {
    run();
    root.write(statusFile, "not a property list");
    EXPECT_EQ(state(), base("RUNNING"));
    root.write(statusFile, "<plist><array/></plist>");
    EXPECT_EQ(state(), base("RUNNING"));
}

TEST_F(State, StartupStatusIsTheLow32BitsOfANumberOrOfADecimalText) {
    run();
    const struct {
        const char* element;
        std::int32_t status;
    } cases[] = {
        {"<integer>-3</integer>", -3},
        {"<integer>4294967365</integer>", 69},            // 2^32 + 69
        {"<integer>4294967295</integer>", -1},            // all bits
        {"<integer>18446744073709551615</integer>", -1},  // all 64 bits
        {"<integer>4294967296</integer>", 0},             // none of the low ones
        {"<string>69</string>", 69},
        {"<string>-3</string>", -3},
        {"<string>4294967365</string>", 69},
        {"<string>6 9</string>", 0},
        {"<string>69x</string>", 0},
        {"<string></string>", 0},
        {"<string>99999999999999999999</string>", 0},
        {"<real>69.9</real>", 69},
        {"<real>-0.5</real>", 0},
        {"<real>1e300</real>", 0},
        {"<true/>", 1},
        {"<false/>", 0},
        {"<array><integer>5</integer></array>", 0},
        {"<date>2026-01-31T08:00:00Z</date>", 0},
    };
    for (const auto& one : cases) {
        startupStatus(one.element);
        const Dictionary answer = state();
        EXPECT_EQ(answer.get("state"), Value(one.status == 0 ? "RUNNING" : "RUNNING_WITH_ISSUE")) << one.element;
        EXPECT_EQ(answer.get("migrationStatus"), one.status == 0 ? Value() : Value(one.status)) << one.element;
    }
}

TEST_F(State, DetailsAreAddedForExactlyOneVariantAtTheTopLevel) {
    run();
    startupStatus("<integer>7</integer>");
    Dictionary expected = base("RUNNING_WITH_ISSUE");
    expected.set("migrationStatus", 7);
    for (const Value& variant : {Value(), Value("withdetails"), Value(""), Value("withDetails "), Value(1)}) {
        Dictionary request;
        request.set("variant", variant);
        EXPECT_EQ(state(request), expected);
    }
    EXPECT_EQ(state({{"optionalArguments", Dictionary{{"variant", "withDetails"}}}}), expected);
    EXPECT_TRUE(details().contains("serviceHasBeenConfigured"));
}

TEST_F(StateDetails, AreInTheirOrderWithTheValuesOfTheSettings) {
    run();
    startupStatus("<integer>7</integer>");
    identity();
    cluster("grid.example", "grid", password);
    makeDatabase();
    root.write(marker, "");
    const Dictionary answer = details();
    EXPECT_THAT(keysOf(answer), ElementsAre("state", "readWriteSettingsVersion", "setStateVersion", "migrationStatus",
                                            "serviceHasBeenConfigured", "startTime", "sharedFileSystemFreeSpace",
                                            "sharedFileSystemPath", "nimboControllerHostname", "sharedFileSystemState",
                                            "nimboControllerState", "totalCameras", "onlineCameras", "capturingCameras",
                                            "currentJobs", "totalJobs"));
    EXPECT_EQ(answer.get("serviceHasBeenConfigured"), Value(true));
    EXPECT_EQ(answer.get("sharedFileSystemPath"), Value("/shared"));
    EXPECT_EQ(answer.get("nimboControllerHostname"), Value("grid.example"));
    EXPECT_EQ(answer.get("sharedFileSystemState"), Value("kSharedFileSystemAvailable"));
    EXPECT_EQ(answer.get("nimboControllerState"), Value("kNimboUnavailable")) << "no Kerberos authority";
    EXPECT_EQ(answer.get("totalCameras"), Value(4));
    EXPECT_EQ(answer.get("onlineCameras"), Value(3));
    EXPECT_EQ(answer.get("capturingCameras"), Value(2));
    EXPECT_EQ(answer.get("currentJobs"), Value(2));
    EXPECT_EQ(answer.get("totalJobs"), Value(3));
    ASSERT_TRUE(answer.get("startTime").date());
    EXPECT_NEAR(static_cast<double>(answer.get("startTime").date()->time_since_epoch().count()),
                static_cast<double>(std::time(nullptr)), 60);
    struct statvfs status {};
    ASSERT_EQ(::statvfs(root.path("/shared").c_str(), &status), 0);
    const auto free = answer.get("sharedFileSystemFreeSpace").unsignedInteger();
    ASSERT_TRUE(free);
    EXPECT_NEAR(static_cast<double>(*free), static_cast<double>(status.f_bavail) * static_cast<double>(status.f_frsize),
                1e9);
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(StateDetails, OfAnUnconfiguredServiceHaveNoSettingsAndNoCounts) {
    const Dictionary answer = details();
    Dictionary expected = base("STOPPED");
    expected.set("serviceHasBeenConfigured", false);
    expected.set("sharedFileSystemState", "kNotConfigured");
    expected.set("nimboControllerState", "kNotConfigured");
    EXPECT_EQ(answer, expected);
    EXPECT_EQ(calls(), "");
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(StateDetails, DefaultSharedFileSystemIsNotShownAsIfItWereSet) {
    fs::create_directories(root.path(LumioRequestHandler::defaultSharedFilesystem));
    identity(std::nullopt);
    const Dictionary answer = details();
    EXPECT_FALSE(answer.contains("sharedFileSystemPath"));
    EXPECT_FALSE(answer.contains("sharedFileSystemFreeSpace"));
    EXPECT_EQ(answer.get("sharedFileSystemState"), Value("kNotConfigured"));
}

TEST_F(StateDetails, StoppedServiceHasNoStartTimeEvenIfThePidFileExists) {
    root.write(pidFile, "");
    EXPECT_FALSE(details().contains("startTime"));
}

TEST_F(StateDetails, StartTimeIsAbsentWithoutAPidFile) {
    EXPECT_FALSE(LumioRequestHandler::getStartTime());
    root.write(pidFile, "1");
    EXPECT_TRUE(LumioRequestHandler::getStartTime());
}

TEST_F(StateDetails, SharedFileSystemIsNotTestedWhenTheServiceFoundItUnavailable) {
    run();
    identity();
    startupStatus("<integer>69</integer>");
    const auto before = fs::last_write_time(root.path("/shared"));
    Dictionary answer = details();
    EXPECT_EQ(answer.get("state"), Value("RUNNING_WITH_ISSUE"));
    EXPECT_EQ(answer.get("migrationStatus"), Value(69));
    EXPECT_EQ(answer.get("sharedFileSystemState"), Value("kSharedFileSystemUnavailable"));
    EXPECT_EQ(fs::last_write_time(root.path("/shared")), before) << "no test file was created";

    startupStatus("<integer>68</integer>");
    answer = details();
    EXPECT_EQ(answer.get("sharedFileSystemState"), Value("kSharedFileSystemAvailable"));
    EXPECT_NE(fs::last_write_time(root.path("/shared")), before);
}

TEST_F(StateDetails, SharedFileSystemThatCannotBeUsedIsUnavailable) {
    identity("/missing");
    EXPECT_EQ(details().get("sharedFileSystemState"), Value("kSharedFileSystemUnavailable"));
    EXPECT_EQ(details().get("sharedFileSystemPath"), Value("/missing"));
    EXPECT_FALSE(details().contains("sharedFileSystemFreeSpace"));
    identity("");
    EXPECT_EQ(details().get("sharedFileSystemState"), Value("kSharedFileSystemUnavailable")) << "an empty path is set";
    EXPECT_EQ(details().get("sharedFileSystemPath"), Value(""));
}

TEST_F(StateDetails, OwnerOfTheTestFileIsTheGridClient) {
    identity();
    cluster(std::nullopt, "unknown", std::nullopt);
    EXPECT_EQ(details().get("sharedFileSystemState"), Value("kSharedFileSystemUnavailable"));
    cluster(std::nullopt, "grid", std::nullopt);
    EXPECT_EQ(details().get("sharedFileSystemState"), Value("kSharedFileSystemAvailable"));
    cluster(std::nullopt, "", std::nullopt);
    EXPECT_EQ(details().get("sharedFileSystemState"), Value("kSharedFileSystemUnavailable")) << "an empty one is one";
}

TEST_F(StateDetails, ControllerIsNotConfiguredIfOneOfItsThreeSettingsIsMissing) {
    identity();
    const auto stateOf = [&] { return details().get("nimboControllerState"); };
    cluster(std::nullopt, "grid", password);
    EXPECT_EQ(stateOf(), Value("kNotConfigured"));
    cluster("grid.example", std::nullopt, password);
    EXPECT_EQ(stateOf(), Value("kNotConfigured"));
    cluster("grid.example", "grid", std::nullopt);
    EXPECT_EQ(stateOf(), Value("kNotConfigured"));
    cluster("grid.example", "grid", password);
    EXPECT_EQ(stateOf(), Value("kNimboUnavailable"));
    EXPECT_EQ(calls(), "") << "the tool is not run for an account without a principal";
}

TEST_F(StateDetails, EmptySettingsOfTheControllerAreNotMissing) {
    EXPECT_EQ(handler.getStateOfNimboController("", "", ""), "kNimboUnavailable");
    EXPECT_EQ(handler.getStateOfNimboController(std::nullopt, "", ""), "kNotConfigured");
    EXPECT_EQ(handler.getStateOfNimboController("", std::nullopt, ""), "kNotConfigured");
    EXPECT_EQ(handler.getStateOfNimboController("", "", std::nullopt), "kNotConfigured");
    EXPECT_EQ(handler.getStateOfSharedFileSystemPath(std::nullopt, "grid"), "kNotConfigured");
}

TEST_F(StateDetails, PasswordThatCannotBeDecipheredIsNotConfigured) {
    identity();
    cluster("grid.example", "grid", password);
    fs::remove(root.path("/shared/Server/Secrets/kek.plist"));
    EXPECT_EQ(details().get("nimboControllerState"), Value("kNotConfigured"));
}

TEST_F(StateDetails, SettingsThatAreNotTextsCountAsMissing) {
    root.writePropertyList(identityFile, "<key>shared_filesystem</key><integer>5</integer>");
    root.writePropertyList("/var/lumio/server/cached_cluster_preferences.plist",
                           "<key>nimbo_controller</key><integer>5</integer>");
    const Dictionary answer = details();
    EXPECT_FALSE(answer.contains("sharedFileSystemPath"));
    EXPECT_FALSE(answer.contains("nimboControllerHostname"));
    EXPECT_EQ(answer.get("sharedFileSystemState"), Value("kNotConfigured"));
}

TEST_F(StateDetails, CountsAreAbsentWithoutADatabaseFileAndNoneIsCreated) {
    identity();
    const Dictionary answer = details();
    for (const char* key : {"totalCameras", "onlineCameras", "capturingCameras", "currentJobs", "totalJobs"}) {
        EXPECT_FALSE(answer.contains(key)) << key;
    }
    EXPECT_FALSE(fs::exists(root.path(database)));
}

TEST_F(StateDetails, CountsAreZeroIfTheDatabaseCannotBeQueriedAndEachFailureIsLogged) {
    identity();
    root.write(database, "not a database, and longer than a header, so that the tool notices it at once");
    const Dictionary answer = details();
    for (const char* key : {"totalCameras", "onlineCameras", "capturingCameras", "currentJobs", "totalJobs"}) {
        EXPECT_EQ(answer.get(key), Value(0)) << key;
    }
    const auto failed = [](const char* beginning) {
        return testing::AllOf(testing::StartsWith(beginning), HasSubstr("sqliteQuery (26)"));
    };
    EXPECT_THAT(log.lines,
                ElementsAre(failed("Error getting total camera count: "), failed("Error getting online camera count: "),
                            failed("Error getting running camera count: "),
                            failed("adminhost_lumio: error getting running jobs count: "),
                            failed("adminhost_lumio: error getting total jobs count: ")));
}

TEST_F(StateDetails, CountsAreZeroIfTheDatabaseToolIsBroken) {
    identity();
    root.write(database, "");
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nexit 1\n");
    EXPECT_EQ(details().get("totalJobs"), Value(0));
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\necho garbage\n");
    EXPECT_EQ(details().get("totalJobs"), Value(0));
}

TEST_F(StateDetails, JobsAreCountedWithTheStatementsOfTheService) {
    identity();
    root.write(database, "");
    root.writeTool("/usr/bin/sqlite3",
                   "#!/bin/sh\necho \"$3\" >> " + root.path("/statements").string() + "\necho 'count(*) = 5'\n");
    EXPECT_EQ(LumioRequestHandler::getTotalJobs(), 5U);
    EXPECT_EQ(LumioRequestHandler::getRunningJobs(), 5U);
    EXPECT_EQ(root.read("/statements"),
              "select count(*) from jobs where nimbo_job_id is not NULL\n"
              "select count(*) from jobs where nimbo_job_status=\"Running\";\n");
}

TEST_F(StateDetails, LastRowOfAJobCountIsTaken) {
    identity();
    root.write(database, "");
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nprintf 'count(*) = 5\\n\\ncount(*) = 6\\n'\n");
    EXPECT_EQ(LumioRequestHandler::getTotalJobs(), 6U);
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\n");
    EXPECT_EQ(LumioRequestHandler::getTotalJobs(), 0U);
}

TEST_F(State, LogPathsAreTheSixOfTheService) {
    const auto response = handler.getLogPathsWithRequest({{"ignored", 1}});
    const Dictionary expected{{"startup_log", "/Library/Logs/lumioserverd/startup.log"},
                              {"application_log", "/Library/Logs/lumioserverd/application.log"},
                              {"server_log", "/Library/Logs/lumioserverd/lumioserverd_out.log"},
                              {"server_error_log", "/Library/Logs/lumioserverd/lumioserverd_error.log"},
                              {"apache_access_log", "/Library/Logs/lumioserverd/apache_access.log"},
                              {"apache_error_log", "/Library/Logs/lumioserverd/apache_error.log"}};
    EXPECT_EQ(response.dictionary(), expected);
    EXPECT_EQ(keysOf(response.dictionary()), keysOf(expected));
}

TEST_F(State, DateKeysAreThoseOfTheResources) {
    EXPECT_THAT(LumioRequestHandler::listOfResourceDateKeys(), ElementsAre("updated_at", "created_at", "used_at"));
}

}  // namespace
}  // namespace lumio
