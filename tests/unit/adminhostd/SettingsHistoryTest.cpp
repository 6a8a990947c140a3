#include "adminhostd/SettingsHistory.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>

#include <gtest/gtest.h>
#include <sys/stat.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;

class History : public testing::Test {
  protected:
    [[nodiscard]] Array read() const { return readHistory(directory, {"a", "b", "password"}, {"password"}); }
    void keep(std::string_view who = "uid 0") const {
        const auto error = keepHistory(directory, files, Dictionary{{"who", who}});
        EXPECT_FALSE(error) << *error->description;
    }

    test::TemporaryRoot root;
    const HostPath directory = historyDirectory("lumio");
    const std::vector<HostPath> files = {HostPath("/one.plist"), HostPath("/two.plist")};
};

TEST_F(History, WithoutEntriesIsEmpty) {
    EXPECT_EQ(read(), Array{});
}

TEST_F(History, EntryHoldsTheSettingsAsTheyWereWithWhoWroteThem) {
    root.writePropertyList("/one.plist", "<key>a</key><integer>1</integer><key>unknown</key><true/>");
    root.writePropertyList("/two.plist", "<key>b</key><string>x</string>");
    keep("uid 7");
    root.writePropertyList("/one.plist", "<key>a</key><integer>2</integer>");
    keep();
    EXPECT_EQ(
        read(),
        (Array{Value(Dictionary{{"who", "uid 7"}, {"number", 1}, {"settings", Dictionary{{"a", 1}, {"b", "x"}}}}),
               Value(Dictionary{{"who", "uid 0"}, {"number", 2}, {"settings", Dictionary{{"a", 2}, {"b", "x"}}}})}));
}

TEST_F(History, SecretsAreKeptButNeverAnswered) {
    root.writePropertyList("/one.plist", "<key>password</key><string>cipher text</string>");
    keep();
    EXPECT_EQ(*read()[0].dictionary()->get("settings").dictionary(), (Dictionary{{"password", "(secret)"}}));
    EXPECT_NE(root.read("/var/lib/adminhostd/history/lumio/00000001/0.plist").find("cipher text"), std::string::npos);
}

TEST_F(History, OnlyItsOwnerCanEnterTheDirectory) {
    keep();
    for (const char* path : {"/var/lib/adminhostd/history/lumio", "/var/lib/adminhostd/history/lumio/00000001"}) {
        EXPECT_EQ(fs::status(root.path(path)).permissions(), fs::perms(0700)) << path;
    }
}

TEST_F(History, MissingAndUnreadableFilesLeaveTheOthersTheirEntry) {
    fs::create_directories(root.path("/one.plist"));
    root.writePropertyList("/two.plist", "<key>b</key><string>x</string>");
    keep();
    EXPECT_EQ(*read()[0].dictionary()->get("settings").dictionary(), (Dictionary{{"b", "x"}}));
}

TEST_F(History, FileThatIsNoPropertyListIsKeptByteForByteAndAnswersNothing) {
    root.write("/one.plist", "not a property list");
    keep();
    EXPECT_EQ(root.read("/var/lib/adminhostd/history/lumio/00000001/0.plist"), "not a property list");
    EXPECT_EQ(*read()[0].dictionary()->get("settings").dictionary(), Dictionary{});
}

TEST_F(History, KeepsTheLastFiftyAndNeverRenumbers) {
    for (int i = 0; i < 53; ++i) {
        keep();
    }
    const Array entries = read();
    ASSERT_EQ(entries.size(), 50U);
    EXPECT_EQ(entries.front().dictionary()->get("number"), Value(4));
    EXPECT_EQ(entries.back().dictionary()->get("number"), Value(53));
}

TEST_F(History, UnfinishedEntryOfAKilledProcessIsRemovedAndNoEntry) {
    root.write("/var/lib/adminhostd/history/lumio/unfinished-1/0.plist", "half");
    EXPECT_EQ(read(), Array{});
    keep();
    EXPECT_EQ(read().size(), 1U);
    EXPECT_FALSE(fs::exists(root.path("/var/lib/adminhostd/history/lumio/unfinished-1")));
}

TEST_F(History, UnfinishedEntryIsRemovedWithoutANewOneToo) {
    keep();
    root.write("/var/lib/adminhostd/history/lumio/unfinished-2/0.plist", "half");
    removeUnfinishedHistory(directory);
    EXPECT_FALSE(fs::exists(root.path("/var/lib/adminhostd/history/lumio/unfinished-2")));
    EXPECT_EQ(read().size(), 1U);
}

TEST_F(History, DirectoryThatCannotBeMadeIsAnErrorThatSaysWhy) {
    root.write("/var/lib", "a file where the directory belongs");
    const auto error = keepHistory(directory, files, {});
    ASSERT_TRUE(error);
    EXPECT_FALSE(error->description->empty());
}

}  // namespace
}  // namespace adminhost
