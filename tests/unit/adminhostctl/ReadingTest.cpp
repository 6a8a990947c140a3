#include "adminhostctl/DaemonClient.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "platform/json/Json.h"
#include "platform/plist/PropertyList.h"
#include "tests/unit/adminhostctl/Describe.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::Array;
using adminhost::Data;
using adminhost::Date;
using adminhost::Dictionary;
using adminhost::Value;
using adminhost::ctl::describe;
using adminhost::ctl::Description;
using adminhost::ctl::Reading;
using adminhost::ctl::Table;
using testing::ElementsAre;

std::string read(const Value& value, std::size_t width = 100) {
    const Description none;
    return Reading(none, width).text(value);
}

std::string readAs(std::string_view command, const Value& value, std::size_t width = 100) {
    const Description description = describe(command);
    return Reading(description, width).text(value);
}

const Date morning = Date(std::chrono::seconds(1769846400));  // 2026-01-31T08:00:00Z

Dictionary person(const char* shortName, const char* longName, const char* type) {
    return {
        {"shortName", shortName}, {"longName", longName}, {"guid", "5B1C8A54"}, {"_id_", "5B1C8A54"}, {"type", type}};
}

Dictionary cameras() {
    return {{"command", "getCameras"},
            {"cameras", Array{Dictionary{{"id", "1"},
                                         {"name", "Lecture hall"},
                                         {"uuid", "0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1E01"},
                                         {"used_at", morning},
                                         {"recording_status", "capturing"},
                                         {"access_control_enabled", true},
                                         {"_id_", "0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1E01"},
                                         {"useUser", "Anna Berg"},
                                         {"allowedUsersAndGroups", Array{person("anna", "Anna Berg", "user"),
                                                                         person("editors", "editors", "group")}}},
                              Dictionary{{"id", "2"},
                                         {"name", "Büro 東京"},
                                         {"uuid", "0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1E02"},
                                         {"used_at", ""},
                                         {"recording_status", "offline"},
                                         {"access_control_enabled", false},
                                         {"allowedUsersAndGroups", Array{}}}}},
            {"readStatus", 0}};
}

TEST(Reading, CamerasAreATableWithPeopleDatesAndYesOrNo) {
    EXPECT_EQ(readAs("getCameras", cameras()),
              "command     getCameras\n"
              "readStatus  0\n"
              "\n"
              "cameras (2)\n"
              "  NAME          STATUS     LAST USED           BY         RESTRICTED  ALLOWED\n"
              "  Lecture hall  capturing  31 Jan 2026, 09:00  Anna Berg  yes         Anna Berg (user), editors\n"
              "                                                                      (group)\n"
              "  Büro 東京     offline                                   no          none\n");
}

TEST(Reading, OneCameraIsAListOfAllItsKeys) {
    const Description description = describe("getCameras");
    EXPECT_EQ(Reading(description, 100).text((*cameras().get("cameras").array())[0], "cameras[]"),
              "id                      1\n"
              "name                    Lecture hall\n"
              "uuid                    0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1E01\n"
              "used_at                 31 Jan 2026, 09:00\n"
              "recording_status        capturing\n"
              "access_control_enabled  yes\n"
              "_id_                    0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1E01\n"
              "useUser                 Anna Berg\n"
              "allowedUsersAndGroups   Anna Berg (user), editors (group)\n");
}

TEST(Reading, SettingsCarryTheirUnitsAndListsFollowThem) {
    EXPECT_EQ(
        readAs("readSettings",
               Dictionary{
                   {"readStatus", 0},
                   {"configuration",
                    Dictionary{{"server_port", "8170"},
                               {"max_file_size_in_mb", 4096},
                               {"upload_chunk_size_in_mb", "16"},
                               {"agent_timeout_seconds", "90"},
                               {"agent_max_recording_minutes", 240},
                               {"tunnel_timeout_seconds", "soon"},
                               {"camera_preview_cache_seconds", 2.5},
                               {"nimbo_client_password_is_set", false},
                               {"properties",
                                Array{Dictionary{{"id", "3"}, {"name", "mark"}, {"value", "left"}, {"protect", false}},
                                      Dictionary{{"id", "4"}, {"name", "key"}, {"protect", true}}}}}}}),
        "readStatus  0\n"
        "\n"
        "configuration\n"
        "  server_port                   8170\n"
        "  max_file_size_in_mb           4096 MB\n"
        "  upload_chunk_size_in_mb       16 MB\n"
        "  agent_timeout_seconds         90 s\n"
        "  agent_max_recording_minutes   240 min\n"
        "  tunnel_timeout_seconds        soon\n"
        "  camera_preview_cache_seconds  2.5 s\n"
        "  nimbo_client_password_is_set  no\n"
        "\n"
        "  properties (2)\n"
        "    NAME  VALUE  PROTECTED\n"
        "    mark  left   no\n"
        "    key          yes\n");
}

TEST(Reading, StateShowsBytesAndDates) {
    EXPECT_EQ(readAs("getState", Dictionary{{"state", "RUNNING"},
                                            {"startTime", morning},
                                            {"sharedFileSystemFreeSpace", std::uint64_t{1'200'000'000'000}}}),
              "state                      RUNNING\n"
              "startTime                  31 Jan 2026, 09:00\n"
              "sharedFileSystemFreeSpace  1.2 TB\n");
}

TEST(Reading, WhatNoDescriptionKnowsIsShownAllTheSame) {
    EXPECT_EQ(read(Dictionary{{"a", Dictionary{{"b", 1}}},
                              {"list", Array{1, "two", true}},
                              {"none", Array{}},
                              {"empty", Dictionary{}},
                              {"data", Data{1, 2}},
                              {"rows", Array{Dictionary{{"x", 1}}, Dictionary{{"y_z", 2}}}}}),
              "list   1, two, yes\n"
              "none   none\n"
              "empty  none\n"
              "data   2 bytes of data\n"
              "\n"
              "a\n"
              "  b  1\n"
              "\n"
              "rows (2)\n"
              "  X  Y Z\n"
              "  1\n"
              "       2\n");
    EXPECT_EQ(read("text"), "text\n");
    EXPECT_EQ(read(Array{}), "none\n");
    EXPECT_EQ(read(Dictionary{}), "none\n");
}

TEST(Reading, TextsOfSeveralLinesAreIndented) {
    EXPECT_EQ(read(Dictionary{{"error", "first\nsecond"}, {"b", 1}}), "error  first\n       second\nb      1\n");
}

TEST(Reading, NothingReachesTheTerminalThatItWouldActOn) {
    EXPECT_EQ(read(Dictionary{{"na\x1bme", "a\x1b[31mb\x07"}}), "na\\x1bme  a\\x1b[31mb\\x07\n");
    EXPECT_EQ(read(Array{Dictionary{{"k\r", "\xE2\x80\xAEtxt"}}}), "K\\X0D\n\\u202etxt\n");
}

TEST(Shown, JsonAndXmlKeepWhatATerminalWouldActOnByNumber) {
    using adminhost::ctl::shownJson;
    using adminhost::ctl::shownXml;
    const std::string acting = "a\x7F\xC2\x9B\xE2\x80\xAE\xE2\x81\xA6";
    EXPECT_EQ(shownJson('"' + acting + "é\"\n"), "\"a\\u007f\\u009b\\u202e\\u2066é\"\n");
    EXPECT_EQ(adminhost::parseJson(shownJson(adminhost::jsonOf(Value(acting)))), Value(acting)) << "nothing is lost";
    EXPECT_EQ(shownXml("<string>" + acting + "</string>\n"), "<string>a&#x7f;&#x9b;&#x202e;&#x2066;</string>\n");
    const auto list = adminhost::xmlPropertyList(Value(acting));
    ASSERT_TRUE(list);
    EXPECT_EQ(adminhost::parsePropertyList(shownXml(*list)), Value(acting));
}

TEST(SizeText, IsDecimalWithOneDecimalForSmallNumbers) {
    using adminhost::ctl::sizeText;
    EXPECT_EQ(sizeText(0), "0 bytes");
    EXPECT_EQ(sizeText(1), "1 byte");
    EXPECT_EQ(sizeText(999), "999 bytes");
    EXPECT_EQ(sizeText(1000), "1.0 kB");
    EXPECT_EQ(sizeText(99'940), "99.9 kB");
    EXPECT_EQ(sizeText(99'960), "100 kB");
    EXPECT_EQ(sizeText(999'499), "999 kB");
    EXPECT_EQ(sizeText(999'500), "1.0 MB");
    EXPECT_EQ(sizeText(1'200'000'000'000), "1.2 TB");
    EXPECT_EQ(sizeText(UINT64_MAX), "18.4 EB");
}

TEST(DateText, IsLocalTime) {
    EXPECT_EQ(adminhost::ctl::dateText(morning), "31 Jan 2026, 09:00");
    EXPECT_EQ(adminhost::ctl::dateText(Date(std::chrono::seconds(1782864000))), "1 Jul 2026, 02:00") << "summer time";
}

TEST(PersonText, NamesKindAndFullName) {
    const Description description = describe("getCameras");
    const adminhost::ctl::DescribedKey& element = *description.answerKey("cameras[].allowedUsersAndGroups[]");
    const auto personText = [&](const Dictionary& entry) { return adminhost::ctl::personText(element, entry); };
    EXPECT_EQ(personText(person("anna", "Anna Berg", "user")), "Anna Berg (user)");
    EXPECT_EQ(personText({{"shortName", "editors"}, {"type", "group"}}), "editors (group)");
    EXPECT_EQ(personText({{"guid", "5B1C"}, {"type", "user"}}), "5B1C (user)");
    EXPECT_EQ(personText({{"shortName", "x"}}), "");
    EXPECT_EQ(personText({{"type", "user"}}), "");
}

TEST(Width, CountsColumnsOfTheTerminal) {
    using adminhost::ctl::widthOf;
    EXPECT_EQ(widthOf("abc"), 3U);
    EXPECT_EQ(widthOf("Büro"), 4U);
    EXPECT_EQ(widthOf("東京"), 4U);
    EXPECT_EQ(widthOf("e\xCC\x81"), 1U) << "a combining accent takes no column";
    EXPECT_EQ(widthOf(""), 0U);
}

TEST(Wrapped, BreaksAtBlanksAndElseWithinWords) {
    using adminhost::ctl::wrapped;
    EXPECT_THAT(wrapped("one two three", 7), ElementsAre("one two", "three"));
    EXPECT_THAT(wrapped("one two three", 8), ElementsAre("one two", "three"));
    EXPECT_THAT(wrapped("abcdefgh", 3), ElementsAre("abc", "def", "gh"));
    EXPECT_THAT(wrapped("東京東京", 5), ElementsAre("東京", "東京"));
    EXPECT_THAT(wrapped("a\n\nb", 5), ElementsAre("a", "", "b"));
    EXPECT_THAT(wrapped("", 5), ElementsAre(""));
}

TEST(Table, NumbersAreAlignedToTheRightAndEmptyColumnsAreOmitted) {
    Table table({"name", "count", "nothing"});
    table.addRow({"a", "5", ""});
    table.addRow({"bcdef", "12,000", ""});
    EXPECT_EQ(table.text(80, 1), " NAME    COUNT\n a           5\n bcdef  12,000\n");
}

TEST(Table, VersionsAreNotNumbers) {
    Table table({"version", "b"});
    table.addRow({"1.0.0", "2.5"});
    EXPECT_EQ(table.text(80, 0), "VERSION    B\n1.0.0    2.5\n");
}

TEST(Table, NarrowsBetweenWordsAsLongAsThatIsEnough) {
    Table table({"status", "people"});
    table.addRow({"capturing_audio_only", "Anna Berg Ben Okafor"});
    EXPECT_EQ(table.text(36, 0),
              "STATUS                PEOPLE\n"
              "capturing_audio_only  Anna Berg Ben\n"
              "                      Okafor\n");
}

TEST(Table, NarrowsItsWidestColumnsAndWrapsThem) {
    Table table({"a", "b"});
    table.addRow({"short", "a rather long text that has to be broken"});
    EXPECT_EQ(table.text(24, 0), "A      B\nshort  a rather long\n       text that has to\n       be broken\n");
}

TEST(Table, LeavesOutItsLastColumnsWhenNarrowingIsNotEnough) {
    Table table({"first", "second", "third"});
    table.addRow({std::string(20, 'a'), std::string(20, 'b'), std::string(20, 'c')});
    EXPECT_EQ(table.text(30, 0),
              "FIRST           SECOND\n"
              "aaaaaaaaaaaaaa  bbbbbbbbbbbbbb\n"
              "aaaaaa          bbbbbb\n"
              "(omitted columns: THIRD)\n");
}

TEST(ErrorOf, FindsStatusesAndTheErrorKeysOfTheDescription) {
    using adminhost::ctl::errorOf;
    EXPECT_EQ(errorOf(describe("getCameras"), cameras()), "");
    EXPECT_EQ(errorOf(describe("getCameras"), {{"readStatus", 5}}), "readStatus is 5");
    EXPECT_EQ(
        errorOf(describe("writeSettings"), {{"readStatus", 0}, {"writeStatus", 400}, {"errorDescription", "no room"}}),
        "writeStatus is 400, errorDescription is no room");
    EXPECT_EQ(errorOf(describe("validateSettings"), {{"shared_filesystem_error", "kFilesystemNotExistsError"}}),
              "shared_filesystem_error is kFilesystemNotExistsError");
    EXPECT_EQ(errorOf(describe("readSettings"), {{"readStatus", -1}}), "readStatus is -1");
    EXPECT_EQ(errorOf({}, {{"readStatus", 0}}), "");
}

}  // namespace
