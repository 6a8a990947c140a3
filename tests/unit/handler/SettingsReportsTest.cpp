// The reports of a write of settings: each key that was changed on disk, and each that was not carried out.

#include "commands/CommandTable.h"
#include "tests/support/CapturedReports.h"
#include "tests/support/Environment.h"
#include "tests/unit/handler/WriteSettingsFixture.h"

#include <algorithm>
#include <cerrno>

#include <sys/syscall.h>
#include <unistd.h>

namespace {

bool directoryFlushFails = false;

}  // namespace

extern "C" int fsync(int descriptor) {
    struct stat status {};
    if (directoryFlushFails && ::fstat(descriptor, &status) == 0 && S_ISDIR(status.st_mode)) {
        errno = EIO;
        return -1;
    }
    return static_cast<int>(::syscall(SYS_fsync, descriptor));
}

namespace lumio {
namespace {

using adminhost::Change;
using adminhost::NotDone;
using testing::ElementsAre;
using testing::UnorderedElementsAre;

constexpr const char* noKeyFile = "/shared/Server/Secrets/kek.plist";

Change changed(std::string key, Value from, Value to) {
    Change change;
    change.section = "settings";
    change.key = key;
    change.from = std::move(from);
    change.to = std::move(to);
    if (!change.from.isNull()) {
        Dictionary undo;
        undo.set(key, change.from);
        change.undo = std::move(undo);
    }
    return change;
}

MATCHER_P2(IsNotDone, path, words, "") {
    return arg.keyPath == path && !arg.reason.empty() && arg.toolMessage.find(words) != std::string::npos &&
           std::string_view(words).empty() == arg.toolMessage.empty();
}

class SettingsReports : public WriteSettings {
  protected:
    /// A value that is not stored yet.
    [[nodiscard]] static Value valueFor(std::string_view key) {
        const CommandDescription* write = findCommand("writeSettings");
        for (const KeyDescription& top : write->keys) {
            for (const KeyDescription& described : top.children) {
                if (top.name == "configuration" && described.name == key) {
                    return described.type == KeyType::text ? Value("/new") : Value(77);
                }
            }
        }
        ADD_FAILURE() << key << " is not described";
        return {};
    }
    /// Puts a directory in place of the file: it can be neither loaded, kept aside nor replaced.
    void obstruct(std::string_view path) const {
        fs::remove_all(root.path(path));
        fs::create_directories(root.path(path));
    }
    [[nodiscard]] std::vector<std::string> changedKeys() const {
        std::vector<std::string> keys;
        for (const Change& change : reports.changes) {
            keys.push_back(change.key);
        }
        return keys;
    }
    void expectOnly(const std::string& key, const std::string& words, const std::vector<std::string>& applied) {
        EXPECT_THAT(reports.parts, ElementsAre(IsNotDone("configuration." + key, words))) << key;
        EXPECT_EQ(changedKeys(), applied) << key;
        reports.parts.clear();
        reports.changes.clear();
    }

    adminhost::test::CapturedReports reports;
};

TEST_F(SettingsReports, EachKeyThatIsChangedOnDiskIsReportedWithTheWayBack) {
    (void)write({{"server_port", 9000},
                 {"server_host", "h"},
                 {"nimbo_grid_id", 1},
                 {"nimbo_controller", "grid.example"},
                 {"member_uuid", "M"},
                 {"nimbo_client_username", "other"}});
    EXPECT_THAT(reports.changes,
                ElementsAre(changed("nimbo_client_username", "grid", "other"), changed("nimbo_grid_id", nullptr, 1),
                            changed("server_host", nullptr, "h"), changed("server_port", 8170, 9000)));
    EXPECT_THAT(reports.parts, IsEmpty());
}

TEST_F(SettingsReports, UndoOfEachChangeTakesItBack) {
    (void)write({{"server_port", 9000}, {"nimbo_client_username", "other"}});
    Dictionary back;
    for (const Change& change : reports.changes) {
        for (const auto& entry : *change.undo.dictionary()) {
            back.set(entry.key, entry.value);
        }
    }
    (void)write(back);
    EXPECT_EQ(file(memberFile).get("server_port"), Value(8170));
    EXPECT_EQ(file(clusterFile).get("nimbo_client_username"), Value("grid"));
}

TEST_F(SettingsReports, PasswordIsReportedWithoutItsValues) {
    Change secret;
    secret.section = "settings";
    secret.key = "nimbo_client_password";
    secret.secret = true;
    Change first = secret;
    first.undo = Dictionary{{"nimbo_client_password", ""}};
    (void)write({{"nimbo_client_password", plainPassword}});
    (void)write({{"nimbo_client_password", plainPassword}});
    (void)write({{"nimbo_client_password", "another"}});
    (void)write({{"nimbo_client_password", ""}});
    EXPECT_THAT(reports.changes, ElementsAre(first, secret, secret));
}

TEST_F(SettingsReports, FileThatIsInPlaceButCannotBeFlushedHasItsChangesReported) {
    directoryFlushFails = true;
    const Dictionary answer = write({{"server_port", 9000}, {"member_uuid", "N"}});
    directoryFlushFails = false;
    EXPECT_EQ(answer.get("writeStatus"), Value(400));
    EXPECT_EQ(file(identityFile).get("member_uuid"), Value("N"));
    EXPECT_THAT(changedKeys(), ElementsAre("member_uuid"));
    EXPECT_THAT(reports.parts, ElementsAre(IsNotDone("configuration", "cannot flush the directory"),
                                           IsNotDone("configuration.server_port", "cannot flush the directory")));
}

TEST_F(SettingsReports, PasswordInAFileThatCannotBeFlushedIsReportedAsChanged) {
    Dictionary config{{"nimbo_client_password", plainPassword}};
    Dictionary result;
    directoryFlushFails = true;
    EXPECT_EQ(handler.setClusterPreferencesFromConfig(config, result), 400);
    directoryFlushFails = false;
    EXPECT_TRUE(file(clusterFile).contains("nimbo_client_password"));
    EXPECT_THAT(changedKeys(), ElementsAre("nimbo_client_password"));
    EXPECT_THAT(reports.parts, ElementsAre(IsNotDone("configuration", "cannot flush the directory")));
}

TEST_F(SettingsReports, FlagWithoutTheNameThatItIsAboutIsReportedAsIgnored) {
    (void)write({{"server_port", 9000}, {"nimbo_controller_resolve_name", true}});
    EXPECT_THAT(reports.parts, ElementsAre(IsNotDone("configuration.nimbo_controller_resolve_name", "")));
    EXPECT_THAT(changedKeys(), ElementsAre("server_port"));
}

TEST_F(SettingsReports, ConfigurationAsItWasReadChangesNothing) {
    const Dictionary config = *handler.readSettingsWithRequest({}).dictionary().get("configuration").dictionary();
    (void)write(config);
    EXPECT_THAT(reports.changes, IsEmpty());
    EXPECT_THAT(reports.parts, IsEmpty());
}

TEST_F(SettingsReports, EachSettingWhoseFileCannotBeWrittenIsOneFindingWithTheSystemsWords) {
    makeDatabase();
    for (const std::string_view key : LumioRequestHandler::memberPreferencesKeysToCopy()) {
        SetUp();
        obstruct(memberFile);
        Dictionary config{{"submissions_groupname", "of " + std::string(key)}};
        config.set(key, valueFor(key));
        (void)write(config);
        expectOnly(std::string(key), "Is a directory", {"submissions_groupname"});
    }
    fs::remove_all(root.path(memberFile));
    for (const std::string_view key : LumioRequestHandler::clusterPreferencesKeysToCopy()) {
        SetUp();
        obstruct(clusterFile);
        Dictionary config{{"member_uuid", "N"}};
        config.set(key, key == "nimbo_controller" ? Value("new.example") : valueFor(key));
        (void)write(config);
        expectOnly(std::string(key), "Is a directory", {"member_uuid"});
        fs::remove_all(root.path(clusterFile));
    }
    for (const std::string_view key : LumioRequestHandler::identityPreferencesKeysToCopy()) {
        SetUp();
        obstruct(identityFile);
        Dictionary config;
        config.set(key, valueFor(key));
        config.set("properties", Array{Value(Dictionary{{"_id_", "1"}, {"value", key}})});
        root.write("/Library/SorvaneProducer/Shared/Server/unused", "");
        (void)write(config);
        const auto own = std::count_if(reports.parts.begin(), reports.parts.end(), [&](const NotDone& part) {
            return part.keyPath == "configuration." + std::string(key);
        });
        EXPECT_EQ(own, 1) << key;
        EXPECT_THAT(reports.parts.front().toolMessage, HasSubstr("Is a directory"));
        EXPECT_TRUE(std::find(changedKeys().begin(), changedKeys().end(), key) == changedKeys().end());
        reports.parts.clear();
        reports.changes.clear();
        fs::remove_all(root.path(identityFile));
    }
}

TEST_F(SettingsReports, PasswordThatCannotBeProtectedIsOneFindingAndTheOthersAreApplied) {
    fs::remove(root.path(noKeyFile));
    (void)write({{"nimbo_client_password", plainPassword}, {"server_port", 3}, {"nimbo_grid_id", 4}});
    expectOnly("nimbo_client_password", noKeyFile, {"nimbo_grid_id", "server_port"});
}

TEST_F(SettingsReports, ControllerThatIsNotResolvedIsOneFindingAndIsStoredAsItWasGiven) {
    const support::ScopedEnvironment missing(
        support::ScopedEnvironment::Changes{{"DBUS_SYSTEM_BUS_ADDRESS", "unix:path=/nowhere/bus"}});
    (void)write({{"nimbo_controller", "Studio"}, {"server_port", 3}});
    ASSERT_EQ(reports.parts.size(), 1U);
    EXPECT_EQ(reports.parts[0].keyPath, "configuration.nimbo_controller");
    EXPECT_FALSE(reports.parts[0].toolMessage.empty());
    EXPECT_EQ(file(clusterFile).get("nimbo_controller"), Value("Studio"));
    EXPECT_THAT(changedKeys(), ElementsAre("nimbo_controller", "server_port"));
}

TEST_F(SettingsReports, FailedScriptIsOneFindingForEachSettingThatItKeepsFromBeingWritten) {
    makeDatabase();
    root.writeTool(preferencesScript, "#!/bin/sh\necho 'no room left' >&2\nexit 5\n");
    (void)write({{"server_port", 1}, {"nimbo_client_password", plainPassword}, {"member_uuid", "N"}});
    EXPECT_THAT(reports.parts, UnorderedElementsAre(IsNotDone("configuration.server_port", "no room left"),
                                                    IsNotDone("configuration.nimbo_client_password", "no room left"),
                                                    IsNotDone("configuration.member_uuid", "no room left")));
    EXPECT_THAT(reports.changes, IsEmpty());
    reports.parts.clear();
    (void)write({});
    EXPECT_THAT(reports.parts, ElementsAre(IsNotDone("configuration", "no room left")));
}

TEST_F(SettingsReports, FailedLibraryScriptIsReportedForClusterAndMemberKeys) {
    root.writeTool(libraryScript, "#!/bin/sh\necho 'no library' >&2\nexit 6\n");
    (void)write({{"server_port", 1}, {"nimbo_grid_id", 1}, {"member_uuid", "N"}});
    EXPECT_THAT(reports.parts, UnorderedElementsAre(IsNotDone("configuration.server_port", "no library"),
                                                    IsNotDone("configuration.nimbo_grid_id", "no library")));
    EXPECT_THAT(changedKeys(), ElementsAre("member_uuid"));
}

TEST_F(SettingsReports, MarkerThatCannotBeCreatedIsAFinding) {
    fs::remove_all(root.path("/var/lumio"));
    root.write("/var/lumio", "a file where the directory belongs");
    (void)write({{"server_port", 1}});
    EXPECT_THAT(reports.parts, ElementsAre(IsNotDone("configuration", "Not a directory")));
    EXPECT_THAT(changedKeys(), ElementsAre("server_port"));
}

TEST_F(SettingsReports, NoReportHoldsTheGridPassword) {
    obstruct(clusterFile);
    (void)write({{"nimbo_client_password", plainPassword}});
    ASSERT_EQ(reports.parts.size(), 1U);
    EXPECT_THAT(reports.parts[0].reason + reports.parts[0].toolMessage, Not(HasSubstr(std::string(plainPassword))));
}

}  // namespace
}  // namespace lumio
