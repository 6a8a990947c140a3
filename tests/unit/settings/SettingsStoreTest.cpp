#include "platform/value/Value.h"
#include "settings/SettingsStore.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>

#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace lumio {
namespace {

using adminhost::Dictionary;
using adminhost::HostPath;

constexpr std::string_view identity = "/Library/Preferences/com.brenn.lumioserverd.plist";
constexpr std::string_view location = "/var/lumio/server/database.yml";

class SettingsStoreTest : public testing::Test {
  protected:
    void useSharedFilesystem(std::string_view path, std::string_view member = "M-1") const {
        root.writePropertyList(identity, "<key>shared_filesystem</key><string>" + std::string(path) +
                                             "</string><key>member_uuid</key><string>" + std::string(member) +
                                             "</string>");
    }
    [[nodiscard]] std::string databaseFor(std::string_view text) const {
        root.write(location, text);
        return SettingsStore::dbPath().text();
    }

    adminhost::test::TemporaryRoot root;
};

TEST_F(SettingsStoreTest, WithoutIdentityPreferencesTheSharedFilesystemIsTheDefaultAndThereIsNoMember) {
    EXPECT_EQ(SettingsStore::sharedFilesystemPath(), "/Library/SorvaneProducer/Shared");
    EXPECT_EQ(SettingsStore::memberUUID(), std::nullopt);
    EXPECT_EQ(SettingsStore::memberPreferencesPath(),
              HostPath("/Library/SorvaneProducer/Shared/Server/member_preferences_(null).plist"));
    EXPECT_EQ(SettingsStore::memberPreferences(), std::nullopt);
}

TEST_F(SettingsStoreTest, IdentityPreferencesWithoutTheKeyGiveTheDefaultSharedFilesystem) {
    root.writePropertyList(identity, "<key>member_uuid</key><string>M</string>");
    EXPECT_EQ(SettingsStore::sharedFilesystemPath(), "/Library/SorvaneProducer/Shared");
    EXPECT_EQ(SettingsStore::memberUUID(), "M");
}

TEST_F(SettingsStoreTest, PathsAreBuiltFromTheSharedFilesystemWithoutNormalisation) {
    useSharedFilesystem("/Volumes//x/");
    EXPECT_EQ(SettingsStore::libraryInformationPath(), HostPath("/Volumes//x//lumioserverd.plist"));
    EXPECT_EQ(SettingsStore::memberPreferencesPath(), HostPath("/Volumes//x//Server/member_preferences_M-1.plist"));
    EXPECT_EQ(SettingsStore::clusterPreferencesPath(), HostPath("/Volumes//x//Server/cluster_preferences.plist"));
}

TEST_F(SettingsStoreTest, LoadsEachOfTheFourFiles) {
    useSharedFilesystem("/shared");
    root.writePropertyList("/shared/lumioserverd.plist", "<key>server_uuid</key><string>S</string>");
    root.writePropertyList("/shared/Server/member_preferences_M-1.plist",
                           "<key>server_port</key><integer>8170</integer>");
    root.writePropertyList("/shared/Server/cluster_preferences.plist", "<key>nimbo_grid_id</key><integer>1</integer>");
    EXPECT_EQ(SettingsStore::identityPreferences(),
              (Dictionary{{"shared_filesystem", "/shared"}, {"member_uuid", "M-1"}}));
    EXPECT_EQ(SettingsStore::libraryInformation(), (Dictionary{{"server_uuid", "S"}}));
    EXPECT_EQ(SettingsStore::memberPreferences(), (Dictionary{{"server_port", 8170}}));
    EXPECT_EQ(SettingsStore::clusterPreferences(), (Dictionary{{"nimbo_grid_id", 1}}));
}

TEST_F(SettingsStoreTest, EveryCallReadsTheFileAgain) {
    useSharedFilesystem("/one");
    EXPECT_EQ(SettingsStore::sharedFilesystemPath(), "/one");
    useSharedFilesystem("/two");
    EXPECT_EQ(SettingsStore::sharedFilesystemPath(), "/two");
}

TEST_F(SettingsStoreTest, CachedCopiesAreReadWhenTheFileOnTheSharedFilesystemIsAbsent) {
    useSharedFilesystem("/shared");
    EXPECT_EQ(SettingsStore::memberPreferences(), std::nullopt);
    EXPECT_EQ(SettingsStore::clusterPreferences(), std::nullopt);
    root.writePropertyList("/var/lumio/server/cached_member_preferences.plist", "<key>a</key><true/>");
    root.writePropertyList("/var/lumio/server/cached_cluster_preferences.plist", "<key>b</key><true/>");
    EXPECT_EQ(SettingsStore::memberPreferences(), (Dictionary{{"a", true}}));
    EXPECT_EQ(SettingsStore::clusterPreferences(), (Dictionary{{"b", true}}));
}

TEST_F(SettingsStoreTest, AnExistingFileThatCannotBeParsedGivesNullAndNotTheCachedCopy) {
    useSharedFilesystem("/shared");
    root.writePropertyList("/var/lumio/server/cached_member_preferences.plist", "<key>a</key><true/>");
    root.writePropertyList("/var/lumio/server/cached_cluster_preferences.plist", "<key>b</key><true/>");
    root.write("/shared/Server/member_preferences_M-1.plist", "not a property list");
    std::filesystem::create_directories(root.path("/shared/Server/cluster_preferences.plist"));
    EXPECT_EQ(SettingsStore::memberPreferences(), std::nullopt);
    EXPECT_EQ(SettingsStore::clusterPreferences(), std::nullopt);
    std::filesystem::remove(root.path("/shared/Server/cluster_preferences.plist"));
    root.write("/shared/Server/cluster_preferences.plist", "not a property list either");
    EXPECT_EQ(SettingsStore::clusterPreferences(), std::nullopt);
}

TEST_F(SettingsStoreTest, IdentityValuesThatAreNotTextsAreReadInTheirTextForm) {
    root.writePropertyList(identity, "<key>shared_filesystem</key><integer>5</integer><key>member_uuid</key><true/>");
    EXPECT_EQ(SettingsStore::sharedFilesystemPath(), "5");
    EXPECT_EQ(SettingsStore::memberUUID(), "1");
    EXPECT_EQ(SettingsStore::memberPreferencesPath(), HostPath("5/Server/member_preferences_1.plist"));
}

TEST_F(SettingsStoreTest, EmptyIdentityValuesStayEmpty) {
    useSharedFilesystem("", "");
    EXPECT_EQ(SettingsStore::sharedFilesystemPath(), "");
    EXPECT_EQ(SettingsStore::memberUUID(), "");
    EXPECT_EQ(SettingsStore::memberPreferencesPath(), HostPath("/Server/member_preferences_.plist"));
}

TEST_F(SettingsStoreTest, AnExistingFileThatCannotBeReadGivesNullAndNotTheCachedCopy) {
    useSharedFilesystem("/shared");
    root.writePropertyList("/var/lumio/server/cached_member_preferences.plist", "<key>a</key><true/>");
    std::filesystem::create_directories(root.path("/shared/Server"));
    // A pipe cannot be read as a file. Missing permissions would not stop tests that are run by the superuser.
    ASSERT_EQ(::mkfifo(root.path("/shared/Server/member_preferences_M-1.plist").c_str(), 0600), 0);
    EXPECT_EQ(SettingsStore::memberPreferences(), std::nullopt);
}

TEST_F(SettingsStoreTest, TextThatIsNoPropertyListLoadsAsNull) {
    root.write(identity, "shared_filesystem: /x");
    EXPECT_EQ(SettingsStore::identityPreferences(), std::nullopt);
    EXPECT_EQ(SettingsStore::sharedFilesystemPath(), "/Library/SorvaneProducer/Shared");
}

TEST_F(SettingsStoreTest, EveryCallFollowsAFileThatWasChangedInPlaceWhateverItsTime) {
    const auto shared = [&](std::string_view text) {
        root.writePropertyList(identity, text);
        std::filesystem::last_write_time(root.path(identity), std::filesystem::file_time_type());
        return SettingsStore::sharedFilesystemPath();
    };
    const std::string standard = "/Library/SorvaneProducer/Shared";
    for (int round = 0; round < 2; ++round) {
        EXPECT_EQ(shared("<key>shared_filesystem</key><string>/a</string>"), "/a");
        EXPECT_EQ(shared("<key>shared_filesystem</key><string>/b</string>"), "/b");
        EXPECT_EQ(shared("<key>shared_filesystem</key><string>/b</strinG>"), standard);
        EXPECT_EQ(shared("<key>shared_filesystem</key><string>/b</string>"), "/b");
        std::filesystem::remove(root.path(identity));
        EXPECT_EQ(SettingsStore::sharedFilesystemPath(), standard);
    }
}

TEST_F(SettingsStoreTest, TopLevelThatIsNoDictionaryLoadsAsNull) {
    root.write(identity, "<plist version=\"1.0\"><array/></plist>");
    EXPECT_EQ(SettingsStore::identityPreferences(), std::nullopt);
}

TEST_F(SettingsStoreTest, RelativeDatabaseValueIsReturnedAsItStandsAndLookedForBelowTheSystemRoot) {
    EXPECT_EQ(databaseFor("production:\n  database: db/prod.sqlite3\n"), "db/prod.sqlite3");
    const std::filesystem::path before = std::filesystem::current_path();
    root.write("/here/db/prod.sqlite3", "");
    std::filesystem::current_path(root.path("/here"));
    EXPECT_FALSE(SettingsStore::dbPathExists()) << "outside the root the current directory would count";
    root.write("/db/prod.sqlite3", "");
    EXPECT_TRUE(SettingsStore::dbPathExists());
    std::filesystem::current_path(before);
}

TEST_F(SettingsStoreTest, TwoBlanksAfterDatabaseGiveTheFallback) {
    EXPECT_EQ(databaseFor("production:\n  database:  db/prod.sqlite3\n"),
              "/Library/SorvaneProducer/Shared/Server/db.sqlite3");
}

TEST_F(SettingsStoreTest, QuotedDatabaseValues) {
    EXPECT_EQ(databaseFor("production:\n  database: \"/db/a.sqlite3\"\n"), "/db/a.sqlite3");
    EXPECT_EQ(databaseFor("production:\n  database: \"\"\n"), "/Library/SorvaneProducer/Shared/Server/db.sqlite3");
    EXPECT_EQ(databaseFor("production:\n  database: \"\n"), "\"");
    EXPECT_EQ(databaseFor("production:\n  database: \"a\n"), "\"a");
}

TEST_F(SettingsStoreTest, OnlyTheDatabaseOfTheProductionSectionCounts) {
    const std::string fallback = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";
    EXPECT_EQ(databaseFor("development:\n  database: /dev\nproduction:\n  database: /prod\n"), "/prod");
    EXPECT_EQ(databaseFor("production:\n  adapter: x\ndevelopment:\n  database: /dev\n"), fallback);
    EXPECT_EQ(databaseFor("database: /early\nproduction:\n  adapter: x\n"), fallback);
    EXPECT_EQ(databaseFor("production:\ndevelopment:\nproduction:\n  database: /late\n"), fallback);
    EXPECT_EQ(databaseFor("production: database: development:"), "development:");
    EXPECT_EQ(databaseFor("Production:\n  database: /x\n"), fallback);
    EXPECT_EQ(databaseFor("production:x\n  database: /x\n"), fallback);
    EXPECT_EQ(databaseFor("production:\n  database:/x\n"), fallback);
    EXPECT_EQ(databaseFor("production:\n  Database: /x\n"), fallback);
    EXPECT_EQ(databaseFor("production:\n  database:"), fallback);
    EXPECT_EQ(databaseFor(""), fallback);
}

TEST_F(SettingsStoreTest, DatabaseValueAtTheVeryEndNeedsNoLineFeed) {
    EXPECT_EQ(databaseFor("production: database: /x"), "/x");
}

TEST_F(SettingsStoreTest, SeparatorsAreUnicodeCharactersAndNotBytes) {
    // U+00E0 is the bytes C3 A0: the second byte alone must not separate.
    EXPECT_EQ(databaseFor("production:\n  database: /Vid\xC3\xA0/x\n"), "/Vid\xC3\xA0/x");
    EXPECT_EQ(databaseFor("production:\xC2\xA0"
                          "database:\xE3\x80\x80/x\xE2\x80\xA8rest"),
              "/x");  // U+00A0, U+3000, U+2028
    EXPECT_EQ(databaseFor("production:\xC2\x85"
                          "database:\v/x\f"),
              "/x");  // U+0085
    EXPECT_EQ(databaseFor("production: database: /a\xE2\x80\x8B"
                          "b"),
              "/a\xE2\x80\x8B"
              "b");  // U+200B joins
}

TEST_F(SettingsStoreTest, EachSeparatorEndsATokenAndNothingElseDoes) {
    for (const std::string_view separator : {" ",
                                             "\t",
                                             "\n",
                                             "\v",
                                             "\f",
                                             "\r",
                                             "\xC2\x85",
                                             "\xC2\xA0",
                                             "\xE1\x9A\x80",
                                             "\xE2\x80\x80",
                                             "\xE2\x80\x81",
                                             "\xE2\x80\x82",
                                             "\xE2\x80\x83",
                                             "\xE2\x80\x84",
                                             "\xE2\x80\x85",
                                             "\xE2\x80\x86",
                                             "\xE2\x80\x87",
                                             "\xE2\x80\x88",
                                             "\xE2\x80\x89",
                                             "\xE2\x80\x8A",
                                             "\xE2\x80\xA8",
                                             "\xE2\x80\xA9",
                                             "\xE2\x80\xAF",
                                             "\xE2\x81\x9F",
                                             "\xE3\x80\x80"}) {
        EXPECT_EQ(databaseFor("production: database: /a" + std::string(separator) + "b"), "/a")
            << testing::PrintToString(separator);
    }
    // The information separators, the zero-width ones, the byte order mark and the Mongolian vowel separator.
    for (const std::string_view other : {"\x1C", "\x1D", "\x1E", "\x1F", "\xE2\x80\x8B", "\xE2\x80\x8D", "\xE2\x81\xA0",
                                         "\xEF\xBB\xBF", "\xE1\xA0\x8E"}) {
        const std::string value = "/a" + std::string(other) + "b";
        EXPECT_EQ(databaseFor("production: database: " + value), value) << testing::PrintToString(other);
    }
}

TEST_F(SettingsStoreTest, LocationFileThatIsNotUtf8GivesTheFallbackBelowTheSharedFilesystem) {
    useSharedFilesystem("/shared");
    EXPECT_EQ(databaseFor("production:\n  database: /x\xFF\n"), "/shared/Server/db.sqlite3");
    std::filesystem::remove(root.path(location));
    EXPECT_EQ(SettingsStore::dbPath(), HostPath("/shared/Server/db.sqlite3"));
    std::filesystem::create_directories(root.path(location));
    EXPECT_EQ(SettingsStore::dbPath(), HostPath("/shared/Server/db.sqlite3"));
}

TEST_F(SettingsStoreTest, DatabasePathIsLookedForBelowTheSystemRoot) {
    root.write(location, "production:\n  database: /db/x.sqlite3\n");
    EXPECT_FALSE(SettingsStore::dbPathExists());
    root.write("/db/x.sqlite3", "");
    EXPECT_TRUE(SettingsStore::dbPathExists());
}

TEST_F(SettingsStoreTest, DatabaseValueWithANulNamesNoFile) {
    root.write("/db/x.sqlite3", "");
    const std::string value("/db/x.sqlite3\0y", 15);
    EXPECT_EQ(databaseFor("production: database: " + value), value);
    EXPECT_FALSE(SettingsStore::dbPathExists());
}

}  // namespace
}  // namespace lumio
