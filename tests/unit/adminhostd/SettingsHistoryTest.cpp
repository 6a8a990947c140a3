#include "adminhostd/FormerValues.h"
#include "adminhostd/SettingsHistory.h"
#include "tests/support/CapturedLog.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;

constexpr const char* directory = "/var/lib/adminhostd/history/lumio";

class HistoryTest : public testing::Test {
  protected:
    /// Performs a write from one state of the settings to another. Returns the entry's number.
    std::uint64_t write(const Dictionary& before, const std::optional<Dictionary>& after, const char* who = "anna") {
        const auto number = history.keep(files, before, Dictionary{{"who", who}});
        EXPECT_TRUE(number) << *number.error().description;
        if (number && after) {
            EXPECT_FALSE(history.complete(*number, *after));
        }
        return number ? *number : 0;
    }
    [[nodiscard]] Dictionary entry(std::size_t index) const {
        const Array entries = history.settingsEntries();
        EXPECT_LT(index, entries.size());
        return index < entries.size() ? *entries[index].dictionary() : Dictionary();
    }
    [[nodiscard]] static Change resourceChange(const char* key, Value from, Value to, bool secret = false) {
        Change change;
        change.section = "properties";
        change.identity = "3";
        change.name = "watermark";
        change.key = key;
        change.from = std::move(from);
        change.to = std::move(to);
        change.secret = secret;
        if (!secret) {
            change.undo = Dictionary{{key, change.from}};
        }
        return change;
    }

    test::TemporaryRoot root;
    test::CapturedLog log;
    const SettingsHistory history{"lumio", {{"a", false}, {"b", false}, {"password", true}}};
    const std::vector<HostPath> files = {HostPath("/one.plist"), HostPath("/two.plist")};
};

TEST_F(HistoryTest, WithoutEntriesIsEmpty) {
    EXPECT_EQ(history.settingsEntries(), Array{});
    EXPECT_EQ(history.resourceEntries(), Array{});
}

TEST_F(HistoryTest, EntryHoldsTheSettingsAsTheyWereWhoWroteAndWhatChanged) {
    write({{"a", 1}, {"b", "x"}}, Dictionary{{"a", 2}});
    EXPECT_EQ(entry(0), (Dictionary{{"who", "anna"},
                                    {"changes", Array{Dictionary{{"key", "a"}, {"from", 1}, {"to", 2}},
                                                      Dictionary{{"key", "b"}, {"from", "x"}}}},
                                    {"number", 1},
                                    {"settings", Dictionary{{"a", 1}, {"b", "x"}}}}));
}

TEST_F(HistoryTest, OnlyTheSettingsThatThePluginNamesAreKeptWhateverTheFilesHold) {
    root.writePropertyList("/one.plist", "<key>a</key><string>of another file's table</string>");
    write({{"b", "x"}, {"unknown", 1}}, Dictionary{{"b", "y"}});
    EXPECT_EQ(entry(0).get("settings"), Value(Dictionary{{"b", "x"}}));
}

TEST_F(HistoryTest, WriteThatChangedNoSettingHasNoEntry) {
    write({{"a", 1}}, Dictionary{{"a", 1}});
    EXPECT_EQ(history.settingsEntries(), Array{});
}

TEST_F(HistoryTest, WriteThatWasKilledHasItsEntry) {
    write({{"a", 1}}, std::nullopt);
    EXPECT_FALSE(entry(0).contains("changes"));
    EXPECT_EQ(entry(0).get("settings"), Value(Dictionary{{"a", 1}}));
}

TEST_F(HistoryTest, EditOutsideTheDaemonIsARowOfItsOwnAndNotTheNextWriters) {
    write({{"a", 1}}, Dictionary{{"a", 2}});
    write({{"a", 5}, {"b", "edited"}}, Dictionary{{"a", 5}, {"b", "written"}}, "berta");
    ASSERT_EQ(history.settingsEntries().size(), 3U);
    const Dictionary outside = entry(1);
    EXPECT_EQ(outside.get("who"), Value("outside the daemon"));
    EXPECT_EQ(outside.get("outside"), Value(true));
    EXPECT_EQ(outside.get("settings"), Value(Dictionary{{"a", 2}}));
    EXPECT_EQ(outside.get("changes"), Value(Array{Dictionary{{"key", "a"}, {"from", 2}, {"to", 5}},
                                                  Dictionary{{"key", "b"}, {"to", "edited"}}}));
    EXPECT_EQ(entry(2).get("who"), Value("berta"));
    EXPECT_EQ(entry(2).get("changes"), Value(Array{Dictionary{{"key", "b"}, {"from", "edited"}, {"to", "written"}}}));
}

TEST_F(HistoryTest, SecretShowsThatItChangedAndNeverItsValue) {
    write({{"password", "cipher one"}}, Dictionary{{"password", "cipher two"}});
    EXPECT_EQ(entry(0).get("settings"), Value(Dictionary{{"password", "(secret)"}}));
    EXPECT_EQ(entry(0).get("changes"),
              Value(Array{Dictionary{
                  {"key", "password"}, {"secret", true}, {"from", "(secret)"}, {"to", "(secret) changed"}}}));
    const std::string about = root.read(std::string(directory) + "/00000001/about.plist");
    EXPECT_EQ(about.find("cipher"), std::string::npos);
    write({{"password", "cipher two"}}, Dictionary{{"password", "cipher two"}});
    EXPECT_EQ(history.settingsEntries().size(), 1U) << "the same secret is no change";
    struct stat status {};
    ASSERT_EQ(::stat(root.path(std::string(directory) + "/digest.key").c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 0777U, 0600U);
}

TEST_F(HistoryTest, FilesAreKeptByteForByteAndMissingOrUnreadableOnesLeaveTheOthersTheirEntry) {
    fs::create_directories(root.path("/one.plist"));
    root.write("/two.plist", "not a property list");
    write({{"a", 1}}, Dictionary{{"a", 2}});
    EXPECT_EQ(root.read(std::string(directory) + "/00000001/1.plist"), "not a property list");
    EXPECT_EQ(history.settingsEntries().size(), 1U);
}

TEST_F(HistoryTest, EntryThatLacksOneOfItsFilesIsNotListed) {
    root.write("/two.plist", "text");
    write({{"a", 1}}, Dictionary{{"a", 2}});
    write({{"a", 2}}, Dictionary{{"a", 3}});
    fs::remove(root.path(std::string(directory) + "/00000001/1.plist"));
    ASSERT_EQ(history.settingsEntries().size(), 1U);
    EXPECT_EQ(entry(0).get("number"), Value(2));
}

TEST_F(HistoryTest, OnlyItsOwnerCanEnterTheDirectoryAndReadTheFiles) {
    root.write("/two.plist", "text");
    write({{"a", 1}}, Dictionary{{"a", 2}});
    for (const char* path : {"", "/00000001"}) {
        EXPECT_EQ(fs::status(root.path(std::string(directory) + path)).permissions(), fs::perms(0700)) << path;
    }
    ASSERT_FALSE(history.keepResources({resourceChange("value", "left", "right")}, {}));
    std::size_t regular = 0;
    for (const fs::directory_entry& entry : fs::recursive_directory_iterator(root.path(std::string(directory)))) {
        if (entry.is_regular_file()) {
            ++regular;
            EXPECT_EQ(entry.status().permissions(), fs::perms(0600)) << entry.path();
        }
    }
    EXPECT_GE(regular, 3U) << "what is kept of the settings and of the resources";
}

TEST_F(HistoryTest, EntryHasTheNumberOfChangesThatItDoesNotHold) {
    ASSERT_FALSE(history.keepResources({resourceChange("value", 1, 2)}, {}, 200));
    ASSERT_FALSE(history.keepResources({}, {}, 3));
    ASSERT_FALSE(history.keepResources({resourceChange("value", 2, 3)}, {}));
    const Array entries = history.resourceEntries();
    ASSERT_EQ(entries.size(), 3U);
    EXPECT_EQ(entries[0].dictionary()->get("changesDropped"), Value(200));
    EXPECT_EQ(entries[1].dictionary()->get("changesDropped"), Value(3));
    EXPECT_FALSE(entries[2].dictionary()->contains("changesDropped"));
}

TEST_F(HistoryTest, SettingsAndResourcesHaveBoundsOfTheirOwnAndAreNeverRenumbered) {
    for (int i = 0; i < 53; ++i) {
        write({{"a", i}}, Dictionary{{"a", i + 1}});
    }
    for (int i = 0; i < 503; ++i) {
        ASSERT_FALSE(history.keepResources({resourceChange("value", i, i + 1)}, {}));
    }
    const Array settings = history.settingsEntries();
    const Array resources = history.resourceEntries();
    ASSERT_EQ(settings.size(), 50U);
    EXPECT_EQ(settings.front().dictionary()->get("number"), Value(4));
    EXPECT_EQ(settings.back().dictionary()->get("number"), Value(53));
    ASSERT_EQ(resources.size(), 500U);
    EXPECT_EQ(resources.front().dictionary()->get("number"), Value(4));
    EXPECT_EQ(resources.back().dictionary()->get("number"), Value(503));
}

TEST_F(HistoryTest, ResourceEntryHoldsTheReportedChangesAndNoneOfTheSettings) {
    Change setting = resourceChange("server_port", 1, 2);
    setting.section = "settings";
    ASSERT_FALSE(history.keepResources({setting}, {}));
    EXPECT_EQ(history.resourceEntries(), Array{});
    ASSERT_FALSE(history.keepResources({setting, resourceChange("value", "left", "right")}, {{"who", "anna"}}));
    const Array expected{Dictionary{{"section", "properties"},
                                    {"identity", "3"},
                                    {"name", "watermark"},
                                    {"key", "value"},
                                    {"from", "left"},
                                    {"to", "right"},
                                    {"undo", Dictionary{{"value", "left"}}},
                                    {"secret", false}}};
    const Array entries = history.resourceEntries();
    ASSERT_EQ(entries.size(), 1U);
    EXPECT_EQ(entries[0].dictionary()->get("who"), Value("anna"));
    EXPECT_EQ(entries[0].dictionary()->get("changes"), Value(expected));
}

TEST_F(HistoryTest, ValueThatBecomesSecretIsReplacedInAllKeptEntries) {
    ASSERT_FALSE(history.keepResources({resourceChange("value", "first plain", "second plain")}, {}));
    Change other = resourceChange("value", "of another", "one");
    other.identity = "4";
    ASSERT_FALSE(history.keepResources({other}, {}));
    ASSERT_FALSE(history.keepResources({resourceChange("value", nullptr, nullptr, true)}, {}));
    for (const auto& file : fs::directory_iterator(root.path(std::string(directory) + "/resources"))) {
        const std::string text = root.read(std::string(directory) + "/resources/" + file.path().filename().string());
        EXPECT_EQ(text.find("plain"), std::string::npos) << file.path();
    }
    const Array entries = history.resourceEntries();
    const Dictionary& hidden = *entries[0].dictionary()->get("changes").array()->front().dictionary();
    EXPECT_EQ(hidden.get("from"), Value("(secret)"));
    EXPECT_EQ(hidden.get("to"), Value("(secret)"));
    EXPECT_FALSE(hidden.contains("undo"));
    EXPECT_EQ(entries[1].dictionary()->get("changes").array()->front().dictionary()->get("from"), Value("of another"));
}

TEST_F(HistoryTest, OnlyTheValuesOfThePartThatBecomesSecretAreReplaced) {
    const Change others[] = {resourceChange("name", "plain", "other"), resourceChange("note", "plain", "other")};
    Change workflow = resourceChange("value", "plain", "other");
    workflow.section = "workflows";
    ASSERT_FALSE(
        history.keepResources({resourceChange("value", "plain", "other"), others[0], others[1], workflow}, {}));
    const auto changesOfFirst = [&] { return *history.resourceEntries()[0].dictionary()->get("changes").array(); };
    const Array before = changesOfFirst();
    ASSERT_FALSE(history.keepResources({resourceChange("value", nullptr, nullptr, true)}, {}));
    const Array after = changesOfFirst();
    EXPECT_EQ(after[0].dictionary()->get("from"), Value("(secret)"));
    for (std::size_t i = 1; i < 4; ++i) {
        EXPECT_EQ(after[i], before[i]) << "the same text elsewhere is not this secret";
    }
    FormerValues former("lumio");
    former.hide({"properties", "3", "name"});
    EXPECT_EQ(changesOfFirst()[1].dictionary()->get("from"), Value("(secret)"));
    EXPECT_EQ(changesOfFirst()[2], before[2]);
}

TEST_F(HistoryTest, UnverifiedChangeIsKeptAsSuch) {
    Change removal = resourceChange("", "3", nullptr);
    removal.unverified = true;
    ASSERT_FALSE(history.keepResources({removal, resourceChange("value", 1, 2)}, {}));
    const Array changes = *history.resourceEntries()[0].dictionary()->get("changes").array();
    EXPECT_EQ(changes[0].dictionary()->get("unverified"), Value(true));
    EXPECT_FALSE(changes[1].dictionary()->contains("unverified"));
}

TEST_F(HistoryTest, ValueThatIsSetAndBecomesSecretInOneRequestIsNotKept) {
    ASSERT_FALSE(
        history.keepResources({resourceChange("value", "first plain", "second plain"),
                               resourceChange("value", nullptr, nullptr, true), resourceChange("name", "old", "new")},
                              {}));
    const Array entries = history.resourceEntries();
    const Array& changes = *entries.at(0).dictionary()->get("changes").array();
    ASSERT_EQ(changes.size(), 3U);
    EXPECT_EQ(changes[0], Value(Dictionary{{"section", "properties"},
                                           {"identity", "3"},
                                           {"name", "watermark"},
                                           {"key", "value"},
                                           {"from", "(secret)"},
                                           {"to", "(secret)"},
                                           {"secret", true}}));
    EXPECT_EQ(changes[2].dictionary()->get("from"), Value("old"));
    EXPECT_EQ(root.read(std::string(directory) + "/resources/00000001.plist").find("plain"), std::string::npos);
}

TEST_F(HistoryTest, FormerValueThatCannotBeHiddenIsReportedAndTheNewEntryIsKept) {
    ASSERT_FALSE(history.keepResources({resourceChange("value", "first plain", "second plain")}, {}));
    fs::create_directories(root.path(std::string(directory) + "/resources/00000001.plist.new"));
    const auto error = history.keepResources({resourceChange("value", nullptr, nullptr, true)}, {});
    ASSERT_TRUE(error);
    EXPECT_THAT(*error->description, HasSubstr("former values of a secret"));
    EXPECT_EQ(history.resourceEntries().size(), 2U);
}

TEST_F(HistoryTest, EntriesOfTheFirstFormatAreReadAndThoseOfANewerOneAreSkippedWithOneLine) {
    const std::string place = directory;
    root.writePropertyList(place + "/00000001/0.plist",
                           "<key>a</key><integer>1</integer><key>password</key><string>cipher</string>"
                           "<key>unknown</key><true/>");
    root.writePropertyList(place + "/00000001/about.plist",
                           "<key>who</key><string>uid 7</string><key>files</key><array><dict><key>path</key>"
                           "<string>/one.plist</string><key>name</key><string>0.plist</string></dict></array>");
    root.writePropertyList(place + "/00000002/about.plist", "<key>format</key><integer>3</integer>");
    root.writePropertyList(place + "/00000003/about.plist", "<key>format</key><integer>4</integer>");
    EXPECT_EQ(history.settingsEntries(),
              (Array{Value(Dictionary{
                  {"who", "uid 7"}, {"number", 1}, {"settings", Dictionary{{"a", 1}, {"password", "(secret)"}}}})}));
    EXPECT_THAT(log.lines, ElementsAre(HasSubstr("2 entries of the history were written by a newer release")));
}

TEST_F(HistoryTest, EntriesOfANewerFormatWithOtherMembersAreLeftOutAndKept) {
    const std::string place = directory;
    const std::string newer =
        "<key>format</key><integer>3</integer><key>files</key><array><string>0.plist</string></array>"
        "<key>settings</key><array/><key>changes</key><string>none</string><key>after</key><true/>";
    root.writePropertyList(place + "/00000001/about.plist", newer);
    root.writePropertyList(place + "/resources/00000001.plist", newer);
    EXPECT_EQ(history.settingsEntries(), Array{});
    EXPECT_EQ(history.resourceEntries(), Array{});
    EXPECT_THAT(log.lines, ElementsAre(HasSubstr("1 entries of the history were written by a newer release"),
                                       HasSubstr("1 entries of the history were written by a newer release")));
    EXPECT_EQ(write({{"a", 1}}, Dictionary{{"a", 2}}), 2U);
    EXPECT_FALSE(history.keepResources({resourceChange("value", "x", nullptr, true)}, {}));
    EXPECT_EQ(history.settingsEntries().size(), 1U);
    EXPECT_EQ(history.resourceEntries().size(), 1U);
    EXPECT_TRUE(fs::exists(root.path(place + "/00000001/about.plist")));
    EXPECT_TRUE(fs::exists(root.path(place + "/resources/00000001.plist")));
}

TEST_F(HistoryTest, FileOfAnEntryOfTheFirstFormatContributesOnlyTheKeysOfItsOwnTable) {
    const std::string place = directory;
    root.writePropertyList(place + "/00000001/0.plist", "<key>a</key><integer>1</integer>");
    root.writePropertyList(place + "/00000001/1.plist",
                           "<key>a</key><string>unmanaged</string><key>c</key><integer>3</integer>");
    // The file with index 0 did not exist.
    root.writePropertyList(place + "/00000002/1.plist",
                           "<key>a</key><string>unmanaged</string><key>c</key><integer>4</integer>");
    const std::string second =
        "<dict><key>path</key><string>/two.plist</string><key>name</key>"
        "<string>1.plist</string></dict></array>";
    root.writePropertyList(place + "/00000001/about.plist",
                           "<key>files</key><array><dict><key>path</key><string>/one.plist</string><key>name</key>"
                           "<string>0.plist</string></dict>" +
                               second);
    root.writePropertyList(place + "/00000002/about.plist", "<key>files</key><array>" + second);
    const SettingsHistory two("lumio", {{"a", false, 0}, {"c", false, 1}});
    EXPECT_EQ(two.settingsEntries(),
              (Array{Value(Dictionary{{"number", 1}, {"settings", Dictionary{{"a", 1}, {"c", 3}}}}),
                     Value(Dictionary{{"number", 2}, {"settings", Dictionary{{"c", 4}}}})}));
}

TEST_F(HistoryTest, UnfinishedEntryOfAKilledProcessIsRemovedAndNoEntry) {
    root.write(std::string(directory) + "/unfinished-1/0.plist", "half");
    EXPECT_EQ(history.settingsEntries(), Array{});
    write({{"a", 1}}, Dictionary{{"a", 2}});
    EXPECT_EQ(history.settingsEntries().size(), 1U);
    EXPECT_FALSE(fs::exists(root.path(std::string(directory) + "/unfinished-1")));
    root.write(std::string(directory) + "/unfinished-2/0.plist", "half");
    history.removeUnfinished();
    EXPECT_FALSE(fs::exists(root.path(std::string(directory) + "/unfinished-2")));
}

TEST_F(HistoryTest, DirectoryThatCannotBeCreatedIsAnErrorWithTheReason) {
    root.write("/var/lib", "a file where the directory belongs");
    const auto number = history.keep(files, {}, {});
    ASSERT_FALSE(number);
    EXPECT_FALSE(number.error().description->empty());
    EXPECT_TRUE(history.keepResources({resourceChange("value", 1, 2)}, {}));
}

}  // namespace
}  // namespace adminhost
