// The plug-in as the worker uses it: its table of operations, through the entry point of the built file.

#include "adminhostd/PluginFile.h"
#include "platform/directory/LocalAccounts.h"
#include "tests/support/CapturedReports.h"
#include "tests/support/ServiceTables.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>
#include <map>
#include <stdexcept>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost {
namespace {

using testing::ElementsAre;

class PluginTable : public testing::Test {
  protected:
    void SetUp() override {
        const auto loaded = loadPlugin(DiskPath(PLUGIN));
        ASSERT_TRUE(loaded) << loaded.error().description.value_or("");
        plugin = loaded->plugin;
        commands = loaded->commands;
    }
    void TearDown() override { setDirectoryNodes({localAccounts()}); }

    /// The code of an error response; empty for every other answer.
    [[nodiscard]] std::string errorOf(std::string_view command) const {
        const Response response = plugin->perform(command, {});
        const std::string* code = response.dictionary().get("error").string();
        return response.kind() == Response::Kind::error && code != nullptr ? *code : "";
    }
    /// Every file below the root with its content.
    [[nodiscard]] std::map<std::string, std::string> files() const {
        std::map<std::string, std::string> all;
        for (const auto& entry : std::filesystem::recursive_directory_iterator(root.path(""))) {
            const std::string place = entry.path().string().substr(root.path("").string().size());
            all.emplace(place, entry.is_regular_file() && !entry.is_symlink() ? root.read(place) : "");
        }
        return all;
    }

    test::TemporaryRoot root;
    test::CapturedLog log;
    Plugin* plugin = nullptr;
    std::vector<Command> commands;
};

TEST_F(PluginTable, EveryDescribedCommandIsServed) {
    ASSERT_FALSE(commands.empty());
    for (const Command& command : commands) {
        EXPECT_NE(errorOf(command.name), "UNKNOWN_COMMAND") << command.name;
    }
}

TEST_F(PluginTable, UnknownKeyOfAConfigurationIsReportedAsNotDone) {
    test::CapturedReports reports;
    static_cast<void>(
        plugin->perform("writeSettings", {{"configuration", Dictionary{{"server_prot", 4}, {"cameras", Array{}}}}}));
    EXPECT_THAT(reports.parts,
                testing::Contains(NotDone{"configuration.server_prot", "ignored: the key is not known", ""}));
}

TEST_F(PluginTable, CommandThatIsNotDescribedIsAnError) {
    EXPECT_EQ(errorOf("getCamera"), "UNKNOWN_COMMAND");
    EXPECT_EQ(errorOf("getCamerasWithRequest"), "UNKNOWN_COMMAND");
    EXPECT_EQ(errorOf(""), "UNKNOWN_COMMAND");
}

/// A broken tool gives counts of 0, and the rest of the state is what an administrator needs then.
TEST_F(PluginTable, StateAndControlOfTheServiceNeedNoDatabase) {
    for (const Command& command : commands) {
        const bool needs = !command.needs.empty();
        for (const char* name : {"getState", "startService", "stopService", "validateSettings", "getLogPaths"}) {
            EXPECT_FALSE(needs && command.name == name) << name;
        }
    }
}

TEST_F(PluginTable, CommandsThatWaitForTheOutsideWorldHaveTheirOwnDeadline) {
    for (const Command& command : commands) {
        if (command.name == "getState" || command.name == "validateSettings") {
            EXPECT_EQ(command.deadline, std::chrono::seconds(60)) << command.name;
        }
    }
}

TEST_F(PluginTable, TicketsOfAnInterruptedCheckAreALeftover) {
    EXPECT_EQ(plugin->leftovers(), std::vector{HostPath("/var/lumio/server/adminhostd_krb_cc")});
}

TEST_F(PluginTable, RecycleServiceAnswersNothingAndChangesNothingWhateverTheVariant) {
    for (const char* const tool : {"/usr/sbin/lumioctl", "/usr/bin/lumioconfig",
                                   "/usr/share/sorvaneproducer/lumioserverd/script/setup_lumioserverd_preferences"}) {
        root.writeTool(tool, "#!/bin/sh\necho called >> " + root.path("/calls").string() + "\n");
    }
    root.sql("/Library/SorvaneProducer/Shared/Server/db.sqlite3", "create table cameras(id)");
    const auto before = files();
    for (const Value& variant : {Value(), Value("withDetails"), Value(""), Value(Dictionary{{"a", 1}})}) {
        Dictionary request;
        request.set("variant", variant);
        EXPECT_EQ(plugin->perform("recycleService", request).kind(), Response::Kind::nothing);
    }
    EXPECT_EQ(files(), before);
    EXPECT_THAT(log.lines, testing::IsEmpty());
}

TEST_F(PluginTable, ExceptionInsideAnOperationReachesTheHost) {
    root.sql("/Library/SorvaneProducer/Shared/Server/db.sqlite3",
             test::camerasTable + "insert into cameras(use_user_uuid) values('A');");
    setDirectoryNodes({{"/Broken", []() -> OpenedDirectoryNode { throw std::runtime_error("no memory"); }}});
    EXPECT_THROW(static_cast<void>(plugin->perform("getCameras", {})), std::runtime_error);
}

TEST_F(PluginTable, SettingsFilesAreThoseThatAWriteReplaces) {
    root.writePropertyList("/Library/Preferences/com.brenn.lumioserverd.plist",
                           "<key>shared_filesystem</key><string>/s</string><key>member_uuid</key><string>M</string>");
    EXPECT_THAT(plugin->settingsFiles(), ElementsAre(HostPath("/Library/Preferences/com.brenn.lumioserverd.plist"),
                                                     HostPath("/s/Server/cluster_preferences.plist"),
                                                     HostPath("/s/Server/member_preferences_M.plist")));
}

TEST_F(PluginTable, SettingsAreTheManagedKeysAsReadingShowsThemAndThePasswordAsItIsStored) {
    root.writePropertyList("/Library/Preferences/com.brenn.lumioserverd.plist",
                           "<key>shared_filesystem</key><string>/s</string><key>member_uuid</key><string>M</string>"
                           "<key>other</key><string>unmanaged</string>");
    root.writePropertyList("/var/lumio/server/cached_member_preferences.plist",
                           "<key>server_port</key><integer>8080</integer><key>tunnel</key><string>unmanaged</string>");
    root.writePropertyList("/s/Server/cluster_preferences.plist",
                           "<key>nimbo_client_password</key><string>stored form</string>"
                           "<key>server_port</key><integer>1</integer><key>nimbo_grid_id</key><integer>7</integer>");
    const auto settings = plugin->settings();
    ASSERT_TRUE(settings);
    EXPECT_EQ(*settings, (Dictionary{{"member_uuid", "M"},
                                     {"shared_filesystem", "/s"},
                                     {"server_port", 8080},
                                     {"nimbo_grid_id", 7},
                                     {"nimbo_client_password", "stored form"}}));
    std::vector<std::string> secrets;
    std::vector<std::string> keys;
    std::map<std::string, std::size_t> fileOf;
    for (const Setting& setting : plugin->settingKeys()) {
        fileOf.emplace(setting.key, setting.file);
        keys.push_back(setting.key);
        if (setting.secret) {
            secrets.push_back(setting.key);
        }
    }
    EXPECT_THAT(secrets, ElementsAre("nimbo_client_password"));
    EXPECT_THAT(plugin->settingsFiles(), ElementsAre(HostPath("/Library/Preferences/com.brenn.lumioserverd.plist"),
                                                     HostPath("/s/Server/cluster_preferences.plist"),
                                                     HostPath("/s/Server/member_preferences_M.plist")));
    EXPECT_THAT(fileOf,
                testing::IsSupersetOf(std::map<std::string, std::size_t>{
                    {"member_uuid", 0}, {"server_port", 2}, {"nimbo_grid_id", 1}, {"nimbo_client_password", 1}}));
    for (const DictionaryEntry& entry : *settings) {
        EXPECT_THAT(keys, testing::Contains(entry.key));
    }
}

TEST_F(PluginTable, SettingsFileThatExistsButCannotBeReadFailsTheSettingsWithItsPath) {
    const std::string identity = "/Library/Preferences/com.brenn.lumioserverd.plist";
    const std::string content =
        "<key>shared_filesystem</key><string>/s</string>"
        "<key>member_uuid</key><string>M</string>";
    for (const std::string& path : {identity, std::string("/s/Server/cluster_preferences.plist"),
                                    std::string("/s/Server/member_preferences_M.plist"),
                                    std::string("/var/lumio/server/cached_cluster_preferences.plist")}) {
        root.writePropertyList(identity, content);
        root.write(path, "half of a pro");
        const auto settings = plugin->settings();
        ASSERT_FALSE(settings) << path;
        EXPECT_THAT(settings.error().description.value_or(""), testing::HasSubstr(path));
        std::filesystem::remove(root.path(path));
    }
    root.writePropertyList(identity, content);
    const auto settings = plugin->settings();
    ASSERT_TRUE(settings) << "a missing file is not an error";
    EXPECT_EQ(*settings, (Dictionary{{"member_uuid", "M"}, {"shared_filesystem", "/s"}}));
}

}  // namespace
}  // namespace adminhost
