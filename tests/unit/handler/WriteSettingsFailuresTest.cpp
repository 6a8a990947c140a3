#include "platform/dnssd/NetService.h"
#include "platform/value/ValueText.h"
#include "tests/unit/handler/WriteSettingsFixture.h"

#include <thread>

namespace lumio {
namespace {

using WriteSettingsFailures = WriteSettings;

TEST_F(WriteSettingsFailures, FailedPreferencesScriptIsTheStatusAndNothingIsWrittenButResourcesAreStillChanged) {
    makeDatabase();
    root.writeTool(preferencesScript, "#!/bin/sh\nexit 5\n");
    const auto before = inodes();
    const Dictionary answer =
        write({{"server_port", 1}, {"properties", Array{Value(Dictionary{{"_id_", "1"}, {"value", "new"}})}}});
    EXPECT_EQ(answer.get("writeStatus"), Value(5));
    EXPECT_FALSE(answer.contains("errorDescription"));
    EXPECT_EQ(inodes(), before);
    EXPECT_EQ(file(memberFile).get("server_port"), Value(8170));
    EXPECT_FALSE(fs::exists(root.path(marker)));
    EXPECT_EQ(root.sql(database, "select value from properties"), "new\n");
}

TEST_F(WriteSettingsFailures, FailedIdentityWriteIs400WithItsTextAndLaterStepsAreSkipped) {
    root.writeTool(libraryScript, "#!/bin/sh\ntouch " + root.path("/library-ran").string() + "\n");
    fs::rename(root.path("/Library/Preferences"), root.path("/Library/gone"));
    root.write("/Library/Preferences", "a file where the directory belongs");
    const std::string member = root.read(memberFile);
    const std::string cluster = root.read(clusterFile);
    const Dictionary answer =
        write({{"shared_filesystem", "/shared"}, {"server_port", 1}, {"nimbo_controller", "second.example"}});
    EXPECT_EQ(root.read(memberFile), member);
    EXPECT_EQ(root.read(clusterFile), cluster);
    EXPECT_FALSE(fs::exists(root.path("/Library/SorvaneProducer/Shared"))) << "nor those of the default place";
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    ASSERT_NE(answer.get("errorDescription").string(), nullptr);
    EXPECT_THAT(*answer.get("errorDescription").string(), HasSubstr(std::string(identityFile)));
    EXPECT_FALSE(fs::exists(root.path("/library-ran")));
    EXPECT_FALSE(fs::exists(root.path(marker)));
}

TEST_F(WriteSettingsFailures, RestartFlagSetBeforeAFailingWriteStays) {
    const Dictionary answer = write({{"shared_filesystem", "/nowhere"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(answer.get("needsRecycleOrRestart"), Value(true));
}

TEST_F(WriteSettingsFailures, FailedLibraryScriptIsTheStatusAndClusterAndMemberAreNotWritten) {
    root.writeTool(libraryScript, "#!/bin/sh\nexit 6\n");
    const Dictionary answer = write({{"member_uuid", "N"}, {"server_port", 1}, {"nimbo_controller", "second.example"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(6));
    EXPECT_EQ(file(identityFile).get("member_uuid"), Value("N"));
    EXPECT_FALSE(fs::exists(root.path("/shared/Server/member_preferences_N.plist")));
    EXPECT_EQ(file(clusterFile).get("nimbo_controller"), Value("grid.example"));
    EXPECT_FALSE(fs::exists(root.path(marker)));
}

TEST_F(WriteSettingsFailures, MissingServerDirectoryUnderTheSharedFilesystemIsAFailedClusterWrite) {
    fs::create_directories(root.path("/empty"));
    const Dictionary answer = write({{"shared_filesystem", "/empty"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_THAT(*answer.get("errorDescription").string(), HasSubstr("/empty/Server/cluster_preferences.plist"));
    EXPECT_THAT(*answer.get("errorDescription").string(), HasSubstr("No such file or directory"));
    EXPECT_FALSE(fs::exists(root.path("/empty/Server")));
}

TEST_F(WriteSettingsFailures, FailedClusterWriteIs400WithItsTextAndTheMemberPreferencesAreNotWritten) {
    fs::remove(root.path(clusterFile));
    fs::create_directories(root.path(clusterFile));
    const Dictionary answer = write({{"server_port", 1}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(answer.get("errorDescription"),
              Value("cannot replace /shared/Server/cluster_preferences.plist: Is a directory"));
    EXPECT_EQ(file(memberFile).get("server_port"), Value(8170));
    EXPECT_FALSE(fs::exists(root.path(marker)));
}

TEST_F(WriteSettingsFailures, FailedWriteKeepsNeitherResourceChangesNorTheReadBackFromTheAnswer) {
    makeDatabase();
    fs::remove(root.path(clusterFile));
    fs::create_directories(root.path(clusterFile));
    const Dictionary answer =
        write({{"server_port", 1}, {"properties", Array{Value(Dictionary{{"_id_", "1"}, {"value", "new"}})}}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(root.sql(database, "select value from properties"), "new\n");
    EXPECT_EQ(answer.at("configuration.server_port"), Value(8170));
}

TEST_F(WriteSettingsFailures, ResolversFailureIsLoggedWithTheServicesNameAndItsError) {
    adminhost::EventLoop loop;
    const adminhost::NetService service(loop, "local", "_nimbo._tcp", "Studio One");
    const Dictionary error{{"errorCode", -15}, {"errorDescription", "Timeout reached"}};
    handler.netService(service, error);
    handler.netServiceDidStop(service);
    EXPECT_THAT(log.lines, testing::ElementsAre("adminhost_lumio: unable to resolve Studio One, error: " +
                                                adminhost::textOf(Value(error))));
}

TEST_F(WriteSettingsFailures, FailedMemberWriteIs400AndNoMarkerIsMade) {
    fs::remove(root.path(memberFile));
    fs::create_directories(root.path(memberFile));
    const Dictionary answer = write({{"nimbo_controller", "second.example"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(answer.get("errorDescription"), Value("cannot replace " + std::string(memberFile) + ": Is a directory"));
    EXPECT_EQ(file(clusterFile).get("nimbo_controller"), Value("second.example"));
    EXPECT_FALSE(fs::exists(root.path(marker)));
}

TEST_F(WriteSettingsFailures, ValueThatAFileCannotCarryIsAFailedWriteAndTheOldFileStands) {
    const Dictionary old = file(memberFile);
    const Dictionary answer = write({{"server_host", std::string("a\x01"
                                                                 "b")}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(file(memberFile), old);
}

TEST_F(WriteSettingsFailures, UnreadableSettingsFileIsKeptBesideAndReplaced) {
    root.write(memberFile, "precious text that is no property list");
    EXPECT_EQ(write({{"server_port", 1}}).get("writeStatus"), Value(0));
    EXPECT_EQ(file(memberFile), (Dictionary{{"server_port", 1}}));
    bool kept = false;
    for (const auto& entry : fs::directory_iterator(root.path("/shared/Server"))) {
        const std::string name = entry.path().filename();
        kept = kept || (name != "member_preferences_M.plist" && name.starts_with("member_preferences_M.plist") &&
                        root.read("/shared/Server/" + name) == "precious text that is no property list");
    }
    EXPECT_TRUE(kept);
    EXPECT_THAT(log.lines,
                Contains(StartsWith("adminhost_lumio: /shared/Server/member_preferences_M.plist cannot be loaded")));
}

TEST_F(WriteSettingsFailures, SettingsFileThatIsALinkIsReplacedAndWhatItLedToStaysAsItWas) {
    fs::rename(root.path(memberFile), root.path("/shared/elsewhere.plist"));
    fs::create_symlink(root.path("/shared/elsewhere.plist"), root.path(memberFile));
    EXPECT_EQ(write({{"server_port", 1}}).get("writeStatus"), Value(0));
    EXPECT_FALSE(fs::is_symlink(root.path(memberFile)));
    EXPECT_EQ(file(memberFile), (Dictionary{{"server_port", 1}, {"kept", "member"}}));
    EXPECT_EQ(file("/shared/elsewhere.plist").get("server_port"), Value(8170));
}

TEST_F(WriteSettingsFailures, SettingsFileThatIsTooLargeIsKeptBesideAndReplaced) {
    fs::resize_file(root.path(memberFile), adminhost::plistMaximumSize + 1);
    EXPECT_EQ(write({{"server_port", 1}}).get("writeStatus"), Value(0));
    EXPECT_EQ(file(memberFile), (Dictionary{{"server_port", 1}}));
    EXPECT_THAT(log.lines, Contains(HasSubstr("member_preferences_M.plist cannot be loaded; it is kept as ")));
}

TEST_F(WriteSettingsFailures, SettingsFileThatIsAPipeIsNeitherReadNorReplaced) {
    fs::remove(root.path(memberFile));
    ASSERT_EQ(::mkfifo(root.path(memberFile).c_str(), 0600), 0);
    const Dictionary answer = write({{"server_port", 1}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_TRUE(fs::is_fifo(root.path(memberFile)));
    EXPECT_THAT(log.lines, Contains(HasSubstr("member_preferences_M.plist cannot be loaded or kept: ")));
}

TEST_F(WriteSettingsFailures, SharedFilesystemThatIsNoDirectoryIsAFailedWriteThatNamesIt) {
    root.write("/flat", "a file");
    const Dictionary answer = write({{"shared_filesystem", "/flat"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_THAT(*answer.get("errorDescription").string(), HasSubstr("/flat/Server/cluster_preferences.plist"));
}

/// The state of a set operation after one failed read of the identity preferences in the middle of a write.
TEST_F(WriteSettingsFailures, UnreadableIdentityPreferencesStopAClusterOrMemberWriteBeforeItTouchesAFile) {
    for (const std::string_view file : {clusterFile, memberFile}) {
        root.write("/Library/SorvaneProducer/Shared" + std::string(file).substr(7), root.read(file));
    }
    root.write(identityFile, "<plist version=\"1.0\"><dict><key>shared_files");
    const std::string cluster = root.read(clusterFile);
    const std::string member = root.read(memberFile);
    Dictionary config{{"server_port", 1}, {"nimbo_grid_id", 1}};
    Dictionary result;
    EXPECT_EQ(handler.setClusterPreferencesFromConfig(config, result), 400);
    EXPECT_THAT(*result.get("errorDescription").string(), HasSubstr(std::string(identityFile)));
    EXPECT_EQ(handler.setMemberPreferencesFromConfig(config, result), 400);
    for (const char* place : {"/shared", "/Library/SorvaneProducer/Shared"}) {
        EXPECT_EQ(root.read(place + std::string(clusterFile).substr(7)), cluster) << place;
        EXPECT_EQ(root.read(place + std::string(memberFile).substr(7)), member) << place;
        EXPECT_EQ(std::distance(fs::directory_iterator(root.path(place + std::string("/Server"))), {}),
                  place == std::string("/shared") ? 3 : 2)
            << "nothing is kept beside them";
    }
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(WriteSettingsFailures, IdentityPreferencesThatAreBeingRewrittenAreLookedAtAgain) {
    const std::string whole = root.read(identityFile);
    root.write(identityFile, whole.substr(0, whole.size() / 2));
    std::thread service([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(20));
        root.write("/whole.plist", whole);
        fs::rename(root.path("/whole.plist"), root.path(identityFile));
    });
    EXPECT_EQ(write({{"server_port", 1}}).get("writeStatus"), Value(0));
    service.join();
    EXPECT_EQ(file(memberFile), (Dictionary{{"server_port", 1}, {"kept", "member"}}));
    EXPECT_EQ(file(identityFile).get("kept"), Value("identity"));
    EXPECT_THAT(log.lines, IsEmpty());
}

}  // namespace
}  // namespace lumio
