#include "handler/LumioRequestHandler.h"
#include "handler/Revision.h"
#include "platform/dnssd/EventLoop.h"
#include "platform/dnssd/NetService.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/Text.h"
#include "resources/Property.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

namespace lumio {
namespace {

namespace fs = std::filesystem;
using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Response;
using adminhost::Value;
using testing::Contains;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;
using testing::StartsWith;

constexpr std::string_view preferencesScript =
    "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_preferences";
constexpr std::string_view libraryScript = "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_library";
constexpr std::string_view identityFile = "/Library/Preferences/com.brenn.lumioserverd.plist";
constexpr std::string_view memberFile = "/shared/Server/member_preferences_M.plist";
constexpr std::string_view clusterFile = "/shared/Server/cluster_preferences.plist";
constexpr std::string_view database = "/shared/Server/db.sqlite3";
constexpr std::string_view marker = "/var/lumio/server/.lumio_setup_done";
constexpr std::string_view plainPassword = "planted-secret-7261";

class WriteSettings : public testing::Test {
  protected:
    void SetUp() override {
        root.writeTool(preferencesScript, "#!/bin/sh\nexit 0\n");
        root.writeTool(libraryScript, "#!/bin/sh\nexit 0\n");
        root.writePropertyList(identityFile,
                               "<key>shared_filesystem</key><string>/shared</string><key>member_uuid</key>"
                               "<string>M</string><key>kept</key><string>identity</string>");
        root.writePropertyList(memberFile,
                               "<key>server_port</key><integer>8170</integer><key>kept</key><string>member</string>");
        root.writePropertyList(clusterFile,
                               "<key>nimbo_client_username</key><string>grid</string><key>nimbo_controller</key>"
                               "<string>grid.example</string><key>kept</key><string>cluster</string>");
        root.writePropertyList("/shared/Server/Secrets/kek.plist",
                               "<key>lumio_secret</key><string>AAECAwQFBgcICQoLDA0ODw==</string>");
        // Owners can be set only by the superuser; whoever runs the tests finds the directory made.
        fs::create_directories(root.path("/var/lumio/server"));
    }

    Dictionary write(Dictionary configuration, std::optional<std::string_view> variant = "getConfig") {
        Dictionary request{{"configuration", std::move(configuration)}};
        if (variant) {
            request.set("optionalArguments", Dictionary{{"variant", *variant}});
        }
        const Response response = handler.writeSettingsWithRequest(request);
        EXPECT_EQ(response.kind(), Response::Kind::dictionary);
        EXPECT_EQ(response.dictionary().get("readStatus"), Value(0));
        return response.dictionary();
    }
    [[nodiscard]] Dictionary file(std::string_view path) const {
        const auto value = adminhost::readPropertyList(adminhost::DiskPath(root.path(path)));
        return value && value->dictionary() != nullptr ? *value->dictionary() : Dictionary{{"unreadable", true}};
    }
    /// A file that was replaced is another one.
    [[nodiscard]] std::vector<ino_t> inodes() const {
        std::vector<ino_t> numbers;
        for (const std::string_view path : {identityFile, clusterFile, memberFile}) {
            struct stat status {};
            EXPECT_EQ(::stat(root.path(path).c_str(), &status), 0) << path;
            numbers.push_back(status.st_ino);
        }
        return numbers;
    }
    void makeDatabase() const {
        root.sql(
            database,
            "create table cameras(id integer primary key,name,uuid,create_user_uuid,created_at,update_user_uuid,"
            "updated_at,last_recording_uuid,use_user_uuid,used_at,recording_status,access_control_enabled,disabled);"
            "create table workflows(id integer primary key,uuid,bundle_path,disabled,access_control_enabled,"
            "use_user_uuid,created_at,updated_at,used_at);"
            "create table properties(id integer primary key,name,value,protect,created_at,updated_at);"
            "create table access_control_entries(record_uuid,resource_type,resource_id);"
            "insert into cameras(name,uuid,access_control_enabled) values('Aula','C-1','f');"
            "insert into properties(name,value,protect) values('p','old','f');");
    }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    LumioRequestHandler handler;
};

TEST_F(WriteSettings, ValuesEqualToTheStoredOnesRewriteTheFilesWithTheSameContents) {
    const Dictionary identity = file(identityFile);
    const Dictionary member = file(memberFile);
    const Dictionary cluster = file(clusterFile);
    const auto before = inodes();
    const Dictionary answer = write({{"shared_filesystem", "/shared"},
                                     {"member_uuid", "M"},
                                     {"server_port", 8170},
                                     {"nimbo_client_username", "grid"},
                                     {"nimbo_controller", "grid.example"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(0));
    EXPECT_FALSE(answer.contains("needsRecycleOrRestart"));
    EXPECT_FALSE(answer.contains("errorDescription"));
    EXPECT_EQ(file(identityFile), identity);
    EXPECT_EQ(file(memberFile), member);
    EXPECT_EQ(file(clusterFile), cluster);
    const auto after = inodes();
    for (std::size_t i = 0; i < before.size(); ++i) {
        EXPECT_NE(before[i], after[i]) << "file " << i << " was not written anew";
    }
    EXPECT_TRUE(fs::exists(root.path(marker)));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(WriteSettings, AbsentConfigurationIsAnEmptyOneAndTheFilesAreStillRewritten) {
    const auto before = inodes();
    const Response response = handler.writeSettingsWithRequest({});
    EXPECT_EQ(response.dictionary().get("writeStatus"), Value(0));
    const auto after = inodes();
    for (std::size_t i = 0; i < before.size(); ++i) {
        EXPECT_NE(before[i], after[i]) << "file " << i;
    }
    EXPECT_EQ(file(memberFile).get("server_port"), Value(8170));
}

TEST_F(WriteSettings, KeysOutsideTheTablesSurviveAndUnknownKeysAreNotStored) {
    (void)write(
        {{"server_port", 9000}, {"kept", "changed"}, {"nimbo_controller_resolve_name", false}, {"invented", 1}});
    EXPECT_EQ(file(memberFile), (Dictionary{{"server_port", 9000}, {"kept", "member"}}));
    EXPECT_EQ(file(identityFile).get("kept"), Value("identity"));
    EXPECT_FALSE(file(clusterFile).contains("nimbo_controller_resolve_name"));
    EXPECT_FALSE(file(clusterFile).contains("invented"));
}

TEST_F(WriteSettings, LibraryInformationIsNeverWritten) {
    (void)write({{"library_version", 99}});
    EXPECT_FALSE(fs::exists(root.path("/shared/lumioserverd.plist")));
}

TEST_F(WriteSettings, ValuesAreStoredWithTheirType) {
    (void)write({{"server_port", "9000"}, {"sorvane_capture_web_enabled", true}, {"max_file_size_in_mb", 1.5}});
    EXPECT_EQ(file(memberFile).get("server_port"), Value("9000"));
    EXPECT_EQ(file(memberFile).get("sorvane_capture_web_enabled"), Value(true));
    EXPECT_EQ(file(memberFile).get("max_file_size_in_mb"), Value(1.5));
}

TEST_F(WriteSettings, ANewSharedFilesystemNeedsARestartAndIsWhereTheOtherFilesAreReadAndWritten) {
    root.writePropertyList("/other/Server/cluster_preferences.plist", "<key>kept</key><string>other</string>");
    root.writeTool(libraryScript, "#!/bin/sh\ngrep -q /other " + root.path(identityFile).string() + "\n");
    const Dictionary old = file(memberFile);
    const Dictionary answer = write({{"shared_filesystem", "/other"}, {"server_port", 1}});
    EXPECT_EQ(answer.get("writeStatus"), Value(0)) << "the library script saw the old shared file system";
    EXPECT_EQ(answer.get("needsRecycleOrRestart"), Value(true));
    EXPECT_EQ(file("/other/Server/member_preferences_M.plist"), (Dictionary{{"server_port", 1}}));
    EXPECT_EQ(file("/other/Server/cluster_preferences.plist"), (Dictionary{{"kept", "other"}}));
    EXPECT_EQ(file(memberFile), old);
}

TEST_F(WriteSettings, CachedCopiesAreTheStartWhereTheNewSharedFilesystemHasNoFiles) {
    root.writePropertyList("/var/lumio/server/cached_member_preferences.plist",
                           "<key>kept</key><string>cached</string>");
    fs::create_directories(root.path("/other/Server"));
    (void)write({{"shared_filesystem", "/other"}});
    EXPECT_EQ(file("/other/Server/member_preferences_M.plist"), (Dictionary{{"kept", "cached"}}));
    EXPECT_EQ(file("/var/lumio/server/cached_member_preferences.plist"), (Dictionary{{"kept", "cached"}}));
}

TEST_F(WriteSettings, ASharedFilesystemThatWasNotStoredNeedsARestart) {
    root.writePropertyList(identityFile, "<key>member_uuid</key><string>M</string>");
    EXPECT_EQ(write({{"shared_filesystem", "/shared"}}).get("needsRecycleOrRestart"), Value(true));
}

TEST_F(WriteSettings, EqualTextOfAnotherTypeIsADifferentValue) {
    root.writePropertyList(clusterFile, "<key>nimbo_client_username</key><integer>5</integer>");
    EXPECT_EQ(write({{"nimbo_client_username", "5"}}).get("needsRecycleOrRestart"), Value(true));
}

TEST_F(WriteSettings, ChangedGridUsernameNeedsARestartAndAChangedPasswordOrControllerDoesNot) {
    EXPECT_EQ(write({{"nimbo_client_username", "other"}}).get("needsRecycleOrRestart"), Value(true));
    EXPECT_FALSE(write({{"nimbo_client_password", "new"}}).contains("needsRecycleOrRestart"));
    EXPECT_FALSE(write({{"nimbo_controller", "second.example"}}).contains("needsRecycleOrRestart"));
    EXPECT_FALSE(write({{"server_port", 4}}).contains("needsRecycleOrRestart"));
}

TEST_F(WriteSettings, NewPasswordIsStoredOnlyInItsProtectedForm) {
    const Dictionary answer = write({{"nimbo_client_password", plainPassword}});
    EXPECT_EQ(answer.get("writeStatus"), Value(0));
    const Value stored = file(clusterFile).get("nimbo_client_password");
    EXPECT_EQ(Property::decryptValue(stored), plainPassword);
    EXPECT_EQ(answer.at("configuration.nimbo_client_password_is_set"), Value(true));
    EXPECT_THAT(adminhost::textOf(Value(answer)), Not(HasSubstr(std::string(plainPassword))));
    for (const auto& entry : fs::recursive_directory_iterator(root.path("/"))) {
        if (entry.is_regular_file() && !entry.is_symlink()) {
            const std::string host = "/" + fs::relative(entry.path(), root.path("/")).string();
            EXPECT_THAT(root.read(host), Not(HasSubstr(std::string(plainPassword)))) << host;
        }
    }
    EXPECT_THAT(log.lines, Not(Contains(HasSubstr(std::string(plainPassword)))));
}

TEST_F(WriteSettings, SamePasswordLeavesTheStoredTextByteForByte) {
    // The same plain text in another form: what the service itself may have stored, without the encoder's line feeds.
    (void)write({{"nimbo_client_password", std::string(60, 'x')}});
    std::string stored = *file(clusterFile).get("nimbo_client_password").string();
    ASSERT_GT(std::erase(stored, '\n'), 0U);
    Dictionary cluster = file(clusterFile);
    cluster.set("nimbo_client_password", stored);
    ASSERT_FALSE(adminhost::writePropertyList(cluster, adminhost::HostPath(std::string(clusterFile))));
    (void)write({{"nimbo_client_password", std::string(60, 'x')}});
    EXPECT_EQ(file(clusterFile).get("nimbo_client_password"), Value(stored));
    (void)write({{"nimbo_client_password", "different"}});
    EXPECT_NE(file(clusterFile).get("nimbo_client_password"), Value(stored));
}

TEST_F(WriteSettings, EmptyPasswordRemovesTheStoredOne) {
    (void)write({{"nimbo_client_password", "x"}});
    const Dictionary answer = write({{"nimbo_client_password", ""}});
    EXPECT_FALSE(file(clusterFile).contains("nimbo_client_password"));
    EXPECT_EQ(answer.at("configuration.nimbo_client_password_is_set"), Value(false));
}

TEST_F(WriteSettings, PasswordThatIsNoTextIsTakenInItsTextForm) {
    (void)write({{"nimbo_client_password", 1234}});
    EXPECT_EQ(Property::decryptValue(*file(clusterFile).get("nimbo_client_password").string()), "1234");
}

TEST_F(WriteSettings, PasswordThatCannotBeProtectedIsLoggedAndTheStoredOneStays) {
    (void)write({{"nimbo_client_password", "first"}});
    const Value stored = file(clusterFile).get("nimbo_client_password");
    fs::remove(root.path("/shared/Server/Secrets/kek.plist"));
    const Dictionary answer = write({{"nimbo_client_password", plainPassword}, {"server_port", 3}});
    EXPECT_EQ(answer.get("writeStatus"), Value(0));
    EXPECT_EQ(file(clusterFile).get("nimbo_client_password"), stored);
    EXPECT_EQ(file(memberFile).get("server_port"), Value(3));
    EXPECT_THAT(log.lines, Contains("adminhost_lumio: nimbo_client_password encryption failed"));
    EXPECT_THAT(log.lines, Not(Contains(HasSubstr(std::string(plainPassword)))));
}

TEST_F(WriteSettings, ControllerWithADotThatDoesNotEndInLocalIsStoredUnchangedWithoutAnyResolution) {
    (void)write({{"nimbo_controller", "grid.local.example"}});
    EXPECT_EQ(file(clusterFile).get("nimbo_controller"), Value("grid.local.example"));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(WriteSettings, ControllerThatIsAbsentOrEmptyBehindItsSuffixIsNotResolved) {
    (void)write({{"nimbo_controller_resolve_name", true}});
    EXPECT_EQ(file(clusterFile).get("nimbo_controller"), Value("grid.example"));
    (void)write({{"nimbo_controller", ".local"}});
    EXPECT_EQ(file(clusterFile).get("nimbo_controller"), Value(".local"));
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(WriteSettings, FailedPreferencesScriptIsTheStatusAndNothingIsWrittenButResourcesAreStillChanged) {
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

TEST_F(WriteSettings, FailedIdentityWriteIs400WithItsTextAndLaterStepsAreSkipped) {
    root.writeTool(libraryScript, "#!/bin/sh\ntouch " + root.path("/library-ran").string() + "\n");
    fs::rename(root.path("/Library/Preferences"), root.path("/Library/gone"));
    root.write("/Library/Preferences", "a file where the directory belongs");
    const Dictionary answer = write({{"shared_filesystem", "/shared"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    ASSERT_NE(answer.get("errorDescription").string(), nullptr);
    EXPECT_THAT(*answer.get("errorDescription").string(), HasSubstr(std::string(identityFile)));
    EXPECT_FALSE(fs::exists(root.path("/library-ran")));
    EXPECT_FALSE(fs::exists(root.path(marker)));
}

TEST_F(WriteSettings, RestartFlagSetBeforeAFailingWriteStays) {
    const Dictionary answer = write({{"shared_filesystem", "/nowhere"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(answer.get("needsRecycleOrRestart"), Value(true));
}

TEST_F(WriteSettings, FailedLibraryScriptIsTheStatusAndClusterAndMemberAreNotWritten) {
    root.writeTool(libraryScript, "#!/bin/sh\nexit 6\n");
    const Dictionary answer = write({{"member_uuid", "N"}, {"server_port", 1}, {"nimbo_controller", "second.example"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(6));
    EXPECT_EQ(file(identityFile).get("member_uuid"), Value("N"));
    EXPECT_FALSE(fs::exists(root.path("/shared/Server/member_preferences_N.plist")));
    EXPECT_EQ(file(clusterFile).get("nimbo_controller"), Value("grid.example"));
    EXPECT_FALSE(fs::exists(root.path(marker)));
}

TEST_F(WriteSettings, MissingServerDirectoryUnderTheSharedFilesystemIsAFailedClusterWrite) {
    fs::create_directories(root.path("/empty"));
    const Dictionary answer = write({{"shared_filesystem", "/empty"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_THAT(*answer.get("errorDescription").string(), HasSubstr("/empty/Server/cluster_preferences.plist"));
    EXPECT_THAT(*answer.get("errorDescription").string(), HasSubstr("No such file or directory"));
    EXPECT_FALSE(fs::exists(root.path("/empty/Server")));
}

TEST_F(WriteSettings, FailedClusterWriteIs400WithItsTextAndTheMemberPreferencesAreNotWritten) {
    fs::remove(root.path(clusterFile));
    fs::create_directories(root.path(clusterFile));
    const Dictionary answer = write({{"server_port", 1}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(answer.get("errorDescription"),
              Value("cannot replace /shared/Server/cluster_preferences.plist: Is a directory"));
    EXPECT_EQ(file(memberFile).get("server_port"), Value(8170));
    EXPECT_FALSE(fs::exists(root.path(marker)));
}

TEST_F(WriteSettings, FailedWriteKeepsNeitherResourceChangesNorTheReadBackFromTheAnswer) {
    makeDatabase();
    fs::remove(root.path(clusterFile));
    fs::create_directories(root.path(clusterFile));
    const Dictionary answer =
        write({{"server_port", 1}, {"properties", Array{Value(Dictionary{{"_id_", "1"}, {"value", "new"}})}}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(root.sql(database, "select value from properties"), "new\n");
    EXPECT_EQ(answer.at("configuration.server_port"), Value(8170));
}

TEST_F(WriteSettings, ResourcesAreChangedCamerasBeforePropertiesAndTheReadBackShowsThem) {
    makeDatabase();
    root.sql(database,
             "create table calls(what);"
             "create trigger c after update on cameras begin insert into calls values('camera'); end;"
             "create trigger p after update on properties begin insert into calls values('property'); end;");
    const Dictionary answer =
        write({{"properties", Array{Value(Dictionary{{"_id_", "1"}, {"value", "new"}})}},
               {"cameras", Array{Value(Dictionary{{"_id_", "C-1"}, {"access_control_enabled", true}})}}},
              std::nullopt);
    EXPECT_EQ(root.sql(database, "select what from calls"), "camera\nproperty\n");
    const Dictionary& config = *answer.get("configuration").dictionary();
    EXPECT_EQ((*config.get("properties").array())[0].dictionary()->get("value"), Value("new"));
    EXPECT_EQ((*config.get("cameras").array())[0].dictionary()->get("access_control_enabled"), Value(true));
}

TEST_F(WriteSettings, ResolversFailureIsLoggedWithTheServicesNameAndItsError) {
    adminhost::EventLoop loop;
    const adminhost::NetService service(loop, "local", "_nimbo._tcp", "Studio One");
    const Dictionary error{{"errorCode", -15}, {"errorDescription", "Timeout reached"}};
    handler.netService(service, error);
    handler.netServiceDidStop(service);
    EXPECT_THAT(log.lines, testing::ElementsAre("adminhost_lumio: unable to resolve Studio One, error: " +
                                                adminhost::textOf(Value(error))));
}

TEST_F(WriteSettings, FailedMemberWriteIs400AndNoMarkerIsMade) {
    fs::remove(root.path(memberFile));
    fs::create_directories(root.path(memberFile));
    const Dictionary answer = write({{"nimbo_controller", "second.example"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(answer.get("errorDescription"), Value("cannot replace " + std::string(memberFile) + ": Is a directory"));
    EXPECT_EQ(file(clusterFile).get("nimbo_controller"), Value("second.example"));
    EXPECT_FALSE(fs::exists(root.path(marker)));
}

TEST_F(WriteSettings, ValueThatAFileCannotCarryIsAFailedWriteAndTheOldFileStands) {
    const Dictionary old = file(memberFile);
    const Dictionary answer = write({{"server_host", std::string("a\x01"
                                                                 "b")}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(file(memberFile), old);
}

TEST_F(WriteSettings, UnreadableSettingsFileIsKeptBesideAndReplaced) {
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

TEST_F(WriteSettings, SettingsFileThatIsALinkIsReplacedAndWhatItLedToStaysAsItWas) {
    fs::rename(root.path(memberFile), root.path("/shared/elsewhere.plist"));
    fs::create_symlink(root.path("/shared/elsewhere.plist"), root.path(memberFile));
    EXPECT_EQ(write({{"server_port", 1}}).get("writeStatus"), Value(0));
    EXPECT_FALSE(fs::is_symlink(root.path(memberFile)));
    EXPECT_EQ(file(memberFile), (Dictionary{{"server_port", 1}, {"kept", "member"}}));
    EXPECT_EQ(file("/shared/elsewhere.plist").get("server_port"), Value(8170));
}

TEST_F(WriteSettings, SettingsFileThatIsTooLargeIsKeptBesideAndReplaced) {
    fs::resize_file(root.path(memberFile), adminhost::plistMaximumSize + 1);
    EXPECT_EQ(write({{"server_port", 1}}).get("writeStatus"), Value(0));
    EXPECT_EQ(file(memberFile), (Dictionary{{"server_port", 1}}));
    EXPECT_THAT(log.lines, Contains(HasSubstr("member_preferences_M.plist cannot be loaded; it is kept as ")));
}

TEST_F(WriteSettings, SettingsFileThatIsAPipeIsNeitherReadNorReplaced) {
    fs::remove(root.path(memberFile));
    ASSERT_EQ(::mkfifo(root.path(memberFile).c_str(), 0600), 0);
    const Dictionary answer = write({{"server_port", 1}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_TRUE(fs::is_fifo(root.path(memberFile)));
    EXPECT_THAT(log.lines, Contains(HasSubstr("member_preferences_M.plist cannot be loaded or kept: ")));
}

TEST_F(WriteSettings, SharedFilesystemThatIsNoDirectoryIsAFailedWriteThatNamesIt) {
    root.write("/flat", "a file");
    const Dictionary answer = write({{"shared_filesystem", "/flat"}});
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_THAT(*answer.get("errorDescription").string(), HasSubstr("/flat/Server/cluster_preferences.plist"));
}

TEST_F(WriteSettings, MarkerThatIsPresentIsLeftAloneAndNothingIsLogged) {
    root.write(marker, "old");
    (void)write({});
    EXPECT_EQ(root.read(marker), "old");
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(WriteSettings, MarkerAndItsDirectoryAreMade) {
    fs::remove_all(root.path("/var/lumio"));
    handler.markSetupDone();
    EXPECT_TRUE(handler.checkSetupDone());
    EXPECT_EQ(fs::file_size(root.path(marker)), 0U);
    struct stat status {};
    ASSERT_EQ(::stat(root.path("/var/lumio/server").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0755U);
    if (::geteuid() == 0) {
        EXPECT_EQ(status.st_uid, 0U);
        EXPECT_EQ(status.st_gid, 0U) << "a missing group wheel is group 0";
        EXPECT_THAT(log.lines, IsEmpty());
    } else {
        EXPECT_THAT(
            log.lines,
            Contains(StartsWith("adminhost_lumio: failed to create directory at path: /var/lumio/server, error: ")));
    }
}

TEST_F(WriteSettings, MarkerDirectoryBelongsToTheRootsGroupWheel) {
    fs::remove_all(root.path("/var/lumio"));
    root.write("/etc/group", "root:x:0:\nwheel:x:4711:\n");
    handler.markSetupDone();
    EXPECT_TRUE(handler.checkSetupDone());
    struct stat status {};
    ASSERT_EQ(::stat(root.path("/var/lumio/server").c_str(), &status), 0);
    if (::geteuid() == 0) {
        EXPECT_EQ(status.st_gid, 4711U);
        EXPECT_THAT(log.lines, IsEmpty());
    } else {
        // Only the superuser can give a directory away.
        EXPECT_THAT(log.lines, testing::ElementsAre(HasSubstr("error: posix (1): cannot set the owner")));
    }
}

TEST_F(WriteSettings, ExistingMarkerDirectoryKeepsItsAttributes) {
    fs::permissions(root.path("/var/lumio/server"), fs::perms(0700));
    handler.markSetupDone();
    EXPECT_TRUE(handler.checkSetupDone());
    EXPECT_EQ(fs::status(root.path("/var/lumio/server")).permissions(), fs::perms(0700));
}

TEST_F(WriteSettings, MarkerThatCannotBeMadeIsLoggedAndTheStatusStaysZero) {
    fs::remove_all(root.path("/var/lumio"));
    root.write("/var/lumio", "a file where the directory belongs");
    EXPECT_EQ(write({}).get("writeStatus"), Value(0));
    ASSERT_EQ(log.lines.size(), 2U);
    EXPECT_THAT(log.lines[0],
                StartsWith("adminhost_lumio: failed to create directory at path: /var/lumio/server, error: "));
    EXPECT_EQ(log.lines[1], "adminhost_lumio: failed to create file at path: /var/lumio/server/.lumio_setup_done");
}

TEST_F(WriteSettings, ReadBackIsNarrowedByTheRequestsVariant) {
    makeDatabase();
    const Dictionary cameras = write({}, "getCameras");
    EXPECT_TRUE(cameras.get("configuration").dictionary()->contains("cameras"));
    EXPECT_FALSE(cameras.get("configuration").dictionary()->contains("server_port"));
    const Dictionary all = write({{"server_port", 12}}, std::nullopt);
    EXPECT_EQ(all.at("configuration.server_port"), Value(12));
    EXPECT_TRUE(all.get("configuration").dictionary()->contains("properties"));
}

TEST_F(WriteSettings, PreferencesScriptRunsAtTheStartAndOnceMoreForTheReadBack) {
    root.writeTool(preferencesScript, "#!/bin/sh\necho p >> " + root.path("/runs").string() + "\n");
    root.writeTool(libraryScript, "#!/bin/sh\necho l >> " + root.path("/runs").string() + "\n");
    (void)write({});
    EXPECT_EQ(root.read("/runs"), "p\nl\np\n");
}

TEST_F(WriteSettings, ResourceChangesNeverReachTheSettingsFiles) {
    makeDatabase();
    (void)write({{"cameras", Array{}}, {"workflows", Array{}}, {"properties", Array{}}});
    for (const std::string_view path : {identityFile, memberFile, clusterFile}) {
        EXPECT_FALSE(file(path).contains("cameras"));
        EXPECT_FALSE(file(path).contains("properties"));
    }
}

TEST_F(WriteSettings, ResourceChangesThatAreNoListsChangeNothing) {
    makeDatabase();
    EXPECT_EQ(write({{"cameras", "C-1"}, {"properties", Dictionary{{"_id_", "1"}}}}).get("writeStatus"), Value(0));
    EXPECT_EQ(root.sql(database, "select value from properties"), "old\n");
}

TEST_F(WriteSettings, RevisionChangesWithSettingsAndResourcesAndNotWithWhatTheServiceDoes) {
    makeDatabase();
    const std::string first = settingsRevision();
    EXPECT_EQ(settingsRevision(), first);
    root.sql(database, "update cameras set recording_status='capturing', used_at='2026-01-01 00:00:00'");
    EXPECT_EQ(settingsRevision(), first);
    (void)write({});
    EXPECT_EQ(settingsRevision(), first) << "rewriting the same values changes nothing";
    (void)write({{"server_port", 99}});
    const std::string second = settingsRevision();
    EXPECT_NE(second, first);
    root.sql(database, "insert into access_control_entries values('U','Camera',1)");
    const std::string third = settingsRevision();
    EXPECT_NE(third, second);
    root.sql(database, "update properties set value='a' || char(10) || 'b'");
    const std::string fourth = settingsRevision();
    EXPECT_NE(fourth, third);
    root.sql(database, "update properties set value='a' || char(10) || 'c'");
    EXPECT_NE(settingsRevision(), fourth);
    root.sql(database, "drop table properties");
    const std::string fifth = settingsRevision();
    EXPECT_NE(fifth, fourth);
    EXPECT_EQ(settingsRevision(), fifth);
    root.sql(database, "update access_control_entries set record_uuid='V'");
    EXPECT_NE(settingsRevision(), fifth) << "what can still be read still counts";
}

}  // namespace
}  // namespace lumio
