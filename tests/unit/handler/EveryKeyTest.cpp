// Every key of the write command, as the descriptions have it, in a request in which its tool or file fails for it
// alone: one report of a part that was not done, with the key's path and the tool's words, and all other changes are
// applied.

#include "commands/CommandTable.h"
#include "platform/directory/LocalAccounts.h"
#include "platform/directory/NameBasedUuid.h"
#include "platform/value/ValueText.h"
#include "tests/support/CapturedReports.h"
#include "tests/unit/handler/WriteSettingsFixture.h"

#include <algorithm>
#include <map>
#include <set>

namespace lumio {
namespace {

using adminhost::Change;
using testing::ElementsAre;

constexpr const char* toolsWords = "no space on the tape";
constexpr const char* addedUser = "anna";
constexpr const char* failingUser = "fail";
constexpr const char* failingRow = "66";
constexpr std::string_view otherMemberFile = "/shared/Server/member_preferences_N.plist";
constexpr std::string_view defaultDatabase = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";

/// "configuration.cameras[].name": a key that holds a single value, with the change entries on its way.
struct Leaf {
    std::string path;
    const KeyDescription* key = nullptr;
    std::vector<const KeyDescription*> entries;  ///< the outermost first
};

void collect(std::span<const KeyDescription> keys, const Leaf& above, std::vector<Leaf>& leaves) {
    for (const KeyDescription& key : keys) {
        Leaf leaf = above;
        leaf.path += (key.name == "[]" || above.path.empty() ? "" : ".") + std::string(key.name);
        leaf.key = &key;
        if (key.entry != nullptr) {
            leaf.entries.push_back(&key);
        }
        if (key.children.empty()) {
            leaves.push_back(leaf);
        } else {
            collect(key.children, leaf, leaves);
        }
    }
}

std::vector<Leaf> leavesOfConfiguration() {
    std::vector<Leaf> leaves;
    collect(findCommand("writeSettings")->keys, {}, leaves);
    std::erase_if(leaves, [](const Leaf& leaf) { return !leaf.path.starts_with("configuration."); });
    return leaves;
}

bool isOneOf(const std::vector<std::string_view>& keys, std::string_view key) {
    return std::find(keys.begin(), keys.end(), key) != keys.end();
}

/// The section of a leaf inside a list: "cameras".
std::string listOf(const Leaf& leaf) {
    const std::size_t begin = leaf.path.find('.') + 1;
    return leaf.path.substr(begin, leaf.path.find("[]") - begin);
}

class EveryKey : public WriteSettings {
  protected:
    void SetUp() override {
        WriteSettings::SetUp();
        adminhost::setDirectoryNodes({adminhost::localAccounts()});
        root.write("/etc/passwd",
                   "anna:x:1001:1001:Anna:/home/anna:/bin/sh\nfail:x:1002:1002:Fail:/home/fail:/bin/sh\n");
        root.write("/etc/group", "");
        fs::remove(root.path(database));
        fs::remove_all(root.path(otherMemberFile));
        makeDatabase();
        root.sql(database,
                 "insert into cameras(uuid,access_control_enabled) values('C-FAIL','f');"
                 "insert into workflows(uuid) values('W-FAIL');"
                 "insert into properties(id,name,value,protect) values(66,'q','old','f'),(3,'r','old','f');");
        // The real tool, except for statements that change what is to fail; reading always works.
        root.writeTool("/usr/bin/sqlite3", std::string("#!/bin/sh\ncase \"$3\" in\n") +
                                               "update*C-FAIL*|update*W-FAIL*|update*id=66|delete*66*|insert*fail*)\n" +
                                               "echo '" + toolsWords + "' >&2; exit 8 ;;\nesac\n" +
                                               "exec /usr/bin/sqlite3 \"$@\"\n");
        root.writeTool("/usr/bin/lumioconfig", std::string("#!/bin/sh\ncase \"$*\" in *fail*|*C-FAIL*)\n") + "echo '" +
                                                   toolsWords + "' >&2; exit 9 ;;\nesac\nexit 0\n");
    }

    static std::string uuidOf(const char* login) {
        return adminhost::textOf(
            adminhost::nameBasedUuid(adminhost::localAccountsNamespace, std::string("user:") + login));
    }

    /// The changes beside the failing one: two elements of each list, the failing one's place between them, and the
    /// settings of the files that are written before the failing one's.
    [[nodiscard]] static Dictionary others(const std::vector<std::string>& settings) {
        const Dictionary added{{"_newid_", true}, {"type", "user"}, {"shortName", addedUser}};
        Dictionary config;
        for (const std::string& key : settings) {
            config.set(key, key == "member_uuid" ? Value("N") : Value(4));
        }
        for (const auto& [list, id] : {std::pair("workflows", "W-1"), std::pair("cameras", "C-1")}) {
            config.set(list, Array{Dictionary{{"_id_", id}, {"access_control_enabled", true}},
                                   Dictionary{{"_id_", id}, {"allowedUsersAndGroups", Array{added}}}});
        }
        config.set("properties", Array{Dictionary{{"_id_", "1"}, {"value", "new"}},
                                       Dictionary{{"_newid_", true}, {"name", "added"}, {"value", "v"}}});
        return config;
    }

    /// An entry of a list whose effect depends on the leaf, and which fails; `place` becomes the path of its report.
    [[nodiscard]] static Dictionary failingEntry(const Leaf& leaf, std::string& place) {
        const KeyDescription& outer = *leaf.entries.front();
        const std::string list = listOf(leaf);
        const std::string_view name = leaf.key->name;
        Dictionary entry;
        if (list != "properties") {
            entry.set("_id_", list == "cameras" ? "C-FAIL" : "W-FAIL");
        }
        if (leaf.entries.size() > 1) {
            const EntryDescription& inner = *leaf.entries.back()->entry;
            const bool removes = name == inner.removedBy || (leaf.key->readFor & effectAdded) == 0;
            Dictionary person;
            person.set(removes ? inner.removedBy : inner.addedBy, true);
            if (removes) {
                person.set("_id_", uuidOf(failingUser));
            } else {
                person.set("type", inner.addedKinds.front());
                person.set("shortName", failingUser);
            }
            EXPECT_TRUE(person.contains(name)) << leaf.path;
            entry.set("allowedUsersAndGroups", Array{std::move(person)});
            place += ".allowedUsersAndGroups.0";
        } else if (name == outer.entry->removedBy) {
            entry.set(name, true);
            entry.set("_id_", list == "cameras" ? "C-FAIL" : failingRow);
        } else if (!leaf.key->with.empty() || name == "access_control_enabled") {
            const std::string_view key = leaf.key->with.empty() ? name : leaf.key->with.front();
            entry.set(key, true);
            place += "." + std::string(key);
        } else if (name == outer.entry->addedBy || (leaf.key->readFor & effectChanged) == 0) {
            entry.set(outer.entry->addedBy, true);
            entry.set("name", failingUser);
            entry.set("value", "v");
            if (name != outer.entry->addedBy) {
                entry.set(name, "99");
            }
        } else {
            entry.set("value", "changed");
            entry.set("_id_", failingRow);
            if (name != "_id_" && name != "value") {
                entry.set(name, leaf.key->type == KeyType::boolean ? Value(true) : Value("changed"));
            }
        }
        EXPECT_TRUE(leaf.entries.size() > 1 || entry.contains(name)) << leaf.path;
        return entry;
    }

    /// Identity, key and new value of each change that was reported, and forgets the reports.
    std::multiset<std::string> takeChanges() {
        std::multiset<std::string> all;
        for (const Change& change : std::exchange(reports.changes, {})) {
            all.insert(change.section + ' ' + change.identity + ' ' + change.key + ' ' + textOf(change.to));
        }
        return all;
    }
    std::multiset<std::string> changesOf(Dictionary config) {
        SetUp();
        (void)write(std::move(config));
        return takeChanges();
    }

    /// Writes the configuration, in which one part fails at this path.
    void expectOneFinding(Dictionary config, const std::string& path, const std::string& words,
                          const std::multiset<std::string>& applied) {
        reports.parts.clear();
        (void)write(std::move(config));
        ASSERT_EQ(reports.parts.size(), 1U) << path;
        EXPECT_EQ(reports.parts.front().keyPath, path);
        EXPECT_THAT(reports.parts.front().reason, Not(IsEmpty())) << path;
        EXPECT_THAT(reports.parts.front().toolMessage, HasSubstr(words)) << path;
        EXPECT_EQ(takeChanges(), applied) << path;
        EXPECT_EQ(root.sql(database,
                           "select (select access_control_enabled from cameras where uuid='C-1'),"
                           "(select access_control_enabled from workflows where uuid='W-1'),"
                           "(select value from properties where id=1),"
                           "(select count(*) from properties where name='added')"),
                  "t|t|new|1\n")
            << path;
    }

    adminhost::test::CapturedReports reports;
};

TEST_F(EveryKey, OfAChangeEntryThatFailsAloneIsOneFindingAndAllOthersAreApplied) {
    const Dictionary rest = others({"member_uuid", "nimbo_grid_id", "server_port"});
    const std::multiset<std::string> applied = changesOf(rest);
    ASSERT_EQ(applied.size(), 9U) << "three settings, four changes of access, two properties";
    std::size_t count = 0;
    for (const Leaf& leaf : leavesOfConfiguration()) {
        if (leaf.entries.empty()) {
            continue;
        }
        ++count;
        SetUp();
        const std::string list = listOf(leaf);
        std::string path = "configuration." + list + ".1";
        Dictionary config = rest;
        Array* entries = config.find(list)->array();
        entries->insert(entries->begin() + 1, failingEntry(leaf, path));
        SCOPED_TRACE(leaf.path);
        expectOneFinding(std::move(config), path, toolsWords, applied);
    }
    EXPECT_GT(count, 10U) << "the keys are not where they were";
}

TEST_F(EveryKey, OfTheSettingsThatFailsAloneIsOneFindingAndAllOthersAreApplied) {
    std::map<std::vector<std::string>, std::multiset<std::string>> changes;
    std::size_t count = 0;
    for (const Leaf& leaf : leavesOfConfiguration()) {
        if (!leaf.entries.empty()) {
            continue;
        }
        ++count;
        const std::string_view key = leaf.key->name;
        std::string words = "Is a directory";
        std::vector<std::string_view> obstructed;
        std::vector<std::string> before{"member_uuid"};
        Value value = leaf.key->type == KeyType::boolean ? Value(true) : Value("/new");
        if (isOneOf(LumioRequestHandler::identityPreferencesKeysToCopy(), key)) {
            obstructed = {identityFile};
            before.clear();
        } else if (isOneOf(LumioRequestHandler::memberPreferencesKeysToCopy(), key)) {
            obstructed = {memberFile, otherMemberFile};
            before.emplace_back("nimbo_grid_id");
        } else if (isOneOf(LumioRequestHandler::clusterPreferencesKeysToCopy(), key)) {
            obstructed = {clusterFile};
            value = key == "nimbo_controller" ? Value("new.example") : value;
        } else {
            before = {"member_uuid", "nimbo_grid_id", "server_port"};
            words = key == "nimbo_client_password" ? "kek.plist does not exist" : "";
        }
        const Dictionary rest = others(before);
        if (!changes.contains(before)) {
            changes[before] = changesOf(rest);
            ASSERT_EQ(changes[before].size(), 6 + before.size());
        }
        SetUp();
        for (const std::string_view file : obstructed) {
            // A directory in the file's place can be neither loaded, kept aside nor replaced.
            fs::remove_all(root.path(file));
            fs::create_directories(root.path(file));
        }
        if (key == "nimbo_client_password") {
            fs::remove(root.path("/shared/Server/Secrets/kek.plist"));
        }
        Dictionary config = rest;
        config.set(key, value);
        SCOPED_TRACE(leaf.path);
        if (isOneOf(obstructed, identityFile)) {
            // Without the identity preferences the shared file system is the default one.
            fs::create_directories(root.path(defaultDatabase).parent_path());
            fs::remove(root.path(defaultDatabase));
            fs::create_hard_link(root.path(database), root.path(defaultDatabase));
        }
        expectOneFinding(std::move(config), leaf.path, words, changes[before]);
        for (const std::string_view file : obstructed) {
            fs::remove_all(root.path(file));
        }
    }
    EXPECT_GT(count, 20U) << "the keys are not where they were";
}

}  // namespace
}  // namespace lumio
