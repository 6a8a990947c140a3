#include "platform/dnssd/EventLoop.h"
#include "platform/dnssd/NetService.h"
#include "platform/value/ValueText.h"
#include "resources/Property.h"
#include "settings/Revision.h"
#include "tests/unit/handler/WriteSettingsFixture.h"

namespace lumio {
namespace {

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
    root.writePropertyList("/var/lumio/server/cached_cluster_preferences.plist",
                           "<key>kept</key><string>cached too</string>"
                           "<key>nimbo_client_username</key><string>cached</string>");
    fs::create_directories(root.path("/other/Server"));
    (void)write({{"shared_filesystem", "/other"}, {"nimbo_grid_id", 3}});
    EXPECT_EQ(file("/other/Server/member_preferences_M.plist"), (Dictionary{{"kept", "cached"}}));
    EXPECT_EQ(file("/other/Server/cluster_preferences.plist"),
              (Dictionary{{"kept", "cached too"}, {"nimbo_client_username", "cached"}, {"nimbo_grid_id", 3}}));
    EXPECT_EQ(file("/var/lumio/server/cached_member_preferences.plist"), (Dictionary{{"kept", "cached"}}));
    EXPECT_EQ(file("/var/lumio/server/cached_cluster_preferences.plist"),
              (Dictionary{{"kept", "cached too"}, {"nimbo_client_username", "cached"}}));
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
    ASSERT_TRUE(adminhost::writePropertyList(cluster, adminhost::HostPath(std::string(clusterFile))));
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

TEST_F(WriteSettings, ReadBackIsNarrowedByTheRequestsVariant) {
    makeDatabase();
    const Dictionary cameras = write({}, "getCameras");
    EXPECT_TRUE(cameras.get("configuration").dictionary()->contains("cameras"));
    EXPECT_FALSE(cameras.get("configuration").dictionary()->contains("server_port"));
    const Dictionary all = write({{"server_port", 12}}, std::nullopt);
    EXPECT_EQ(all.at("configuration.server_port"), Value(12));
    EXPECT_TRUE(all.get("configuration").dictionary()->contains("properties"));
}

TEST_F(WriteSettings, EachVariantSendsExactlyItsOwnKeysBack) {
    makeDatabase();
    using Keys = std::vector<std::string>;
    const Keys start{"default_shared_filesystem"};
    const Keys settings{"member_uuid",      "shared_filesystem",
                        "nimbo_controller", "nimbo_client_username",
                        "nimbo_grid_id",    "nimbo_client_password_is_set",
                        "server_port"};
    const Keys workflows{"workflows"};
    const auto joined = [](std::initializer_list<Keys> lists) {
        Keys all;
        for (const Keys& list : lists) {
            all.insert(all.end(), list.begin(), list.end());
        }
        return all;
    };
    const auto sentBack = [&](std::optional<std::string_view> variant) {
        Keys keys;
        const Dictionary answer = write({{"nimbo_grid_id", 1}}, variant);
        for (const auto& entry : *answer.get("configuration").dictionary()) {
            keys.push_back(entry.key);
        }
        return keys;
    };
    EXPECT_EQ(sentBack(std::nullopt), joined({start, settings, {"cameras"}, workflows, {"properties"}}));
    EXPECT_EQ(sentBack("getConfig"), joined({start, settings, {"properties"}}));
    EXPECT_EQ(sentBack("getCameras"), joined({start, {"cameras"}}));
    EXPECT_EQ(sentBack("getWorkflows"), joined({start, workflows}));
    EXPECT_EQ(sentBack("getProperties"), joined({start, {"properties"}}));
    EXPECT_EQ(sentBack("getconfig"), start);
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

}  // namespace
}  // namespace lumio
