// Requests that the check refuses, and what each would do in the operations, which put values into
// statements and arguments as they are.

#include "commands/CommandTable.h"
#include "handler/LumioRequestHandler.h"
#include "tests/support/TemporaryRoot.h"

#include <filesystem>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Value;
using testing::HasSubstr;

constexpr std::string_view database = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";

class RefusedRequests : public testing::Test {
  protected:
    void SetUp() override {
        root.sql(database,
                 "create table cameras(id integer primary key,name,uuid,access_control_enabled,disabled);"
                 "create table properties(id integer primary key,name,value,protect,created_at,updated_at);"
                 "insert into cameras(uuid,access_control_enabled) values('C-1','f'),('C-2','f');"
                 "insert into properties(name,value,protect) values('one','1','f'),('two','2','f');");
        root.writeTool("/usr/bin/lumioconfig", "#!/bin/sh\necho \"$@\" >> " + root.path("/calls").string() + "\n");
    }
    /// The key paths that the check refuses in one change entry of the list.
    [[nodiscard]] static std::vector<std::string> refused(std::string_view list, const Dictionary& entry) {
        Dictionary config;
        config.set(list, Array{Value(entry)});
        std::vector<std::string> paths;
        for (const adminhost::Finding& finding : checkRequest("writeSettings", Dictionary{{"configuration", config}})) {
            paths.push_back(finding.keyPath);
            EXPECT_FALSE(finding.rule.empty());
            EXPECT_FALSE(finding.advice.empty());
        }
        return paths;
    }
    void changeProperty(const Dictionary& entry) {
        const Array changes{Value(entry)};
        handler.processPropertyChangesWithRequest(&changes);
    }
    void changeCamera(const Dictionary& entry) {
        const Array changes{Value(entry)};
        handler.processCameraChangesWithRequest(&changes);
    }
    [[nodiscard]] std::string rows() const {
        return root.sql(database, "select name,value from properties order by id");
    }
    static std::vector<std::string> path(std::string_view text) { return {std::string(text)}; }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;
    LumioRequestHandler handler;
};

TEST_F(RefusedRequests, DoubleQuoteInANameWouldRunTheDatabaseToolsFileFunctions) {
    // The one directory that a confined tool can write.
    constexpr std::string_view place = "/Library/SorvaneProducer/Shared/Server/planted";
    const std::string planted = root.path(place).string();
    const Dictionary entry{{"_newid_", true}, {"name", "x\" or writefile('" + planted + "','rootshell') or \""}};
    EXPECT_EQ(refused("properties", entry), path("configuration.properties.0.name"));
    changeProperty(entry);
    EXPECT_EQ(root.read(place), "rootshell");
}

TEST_F(RefusedRequests, DoubleQuoteInAValueWouldEndTheTextAndSetOtherColumns) {
    const Dictionary entry{{"_id_", "1"}, {"value", "x\", name=\"stolen"}};
    EXPECT_EQ(refused("properties", entry), path("configuration.properties.0.value"));
    changeProperty(entry);
    EXPECT_EQ(rows(), "stolen|x\ntwo|2\n");
}

TEST_F(RefusedRequests, ValueEqualToAColumnsNameWouldStoreTheColumn) {
    const Dictionary entry{{"_id_", "1"}, {"value", "Name"}};
    EXPECT_EQ(refused("properties", entry), path("configuration.properties.0.value"));
    changeProperty(entry);
    EXPECT_EQ(rows(), "one|one\ntwo|2\n");
}

TEST_F(RefusedRequests, ValueEqualToTheRowsNumberNameWouldStoreTheNumber) {
    const Dictionary entry{{"_id_", "2"}, {"value", "_rowid_"}};
    EXPECT_EQ(refused("properties", entry), path("configuration.properties.0.value"));
    changeProperty(entry);
    EXPECT_EQ(rows(), "one|1\ntwo|2\n") << "the row's number is 2";
}

TEST_F(RefusedRequests, NameEqualToAColumnsNameWouldStoreTheColumn) {
    const Dictionary entry{{"_id_", "1"}, {"name", "protect"}};
    EXPECT_EQ(refused("properties", entry), path("configuration.properties.0.name"));
    changeProperty(entry);
    EXPECT_EQ(rows(), "f|1\ntwo|2\n");
}

TEST_F(RefusedRequests, LineFeedsInAValuePassAndForgeNoPropertyInTheList) {
    const Dictionary entry{{"_id_", "1"}, {"value", "x\n\n   id = 77\n name = forged\nvalue = y\nprotect = f"}};
    EXPECT_THAT(refused("properties", entry), testing::IsEmpty());
    changeProperty(entry);
    const adminhost::Response read = handler.getPropertiesWithRequest({});
    bool forged = false;
    for (const Value& property : *read.dictionary().get("properties").array()) {
        forged = forged || property.dictionary()->get("name") == Value("forged");
    }
    EXPECT_FALSE(forged) << "values are read back exactly";
    EXPECT_EQ(root.sql(database, "select count(*) from properties"), "2\n");
}

TEST_F(RefusedRequests, NulInAValueWouldBeAFailedStart) {
    const Dictionary entry{{"_id_", "1"}, {"value", std::string("a\0b", 3)}};
    EXPECT_EQ(refused("properties", entry), path("configuration.properties.0.value"));
    changeProperty(entry);
    EXPECT_EQ(rows(), "one|1\ntwo|2\n");
    EXPECT_THAT(log.lines.back(), HasSubstr("could not update property"));
}

TEST_F(RefusedRequests, TextAboveTheBoundWouldBeAFailedStart) {
    const Dictionary entry{{"_newid_", true}, {"name", "big"}, {"value", std::string(140'000, 'x')}};
    EXPECT_EQ(refused("properties", entry), path("configuration.properties.0.value"));
    changeProperty(entry);
    EXPECT_EQ(rows(), "one|1\ntwo|2\n");
    EXPECT_THAT(log.lines.back(), HasSubstr("could not insert new property"));
}

TEST_F(RefusedRequests, IdentifierThatIsNoNumberWouldDeleteEveryProperty) {
    const Dictionary entry{{"_obsoleteid_", true}, {"_id_", "0\" or \"1\"=\"1"}};
    EXPECT_EQ(refused("properties", entry), path("configuration.properties.0._id_"));
    changeProperty(entry);
    EXPECT_EQ(rows(), "");
}

TEST_F(RefusedRequests, IdentifierWithAQuoteWouldSwitchEveryCamera) {
    const Dictionary entry{{"_id_", "x\" or \"1\"=\"1"}, {"access_control_enabled", true}};
    EXPECT_EQ(refused("cameras", entry), path("configuration.cameras.0._id_"));
    changeCamera(entry);
    EXPECT_EQ(root.sql(database, "select access_control_enabled from cameras"), "t\nt\n");
}

TEST_F(RefusedRequests, IdentifierThatBeginsWithAHyphenWouldBeAnOptionOfTheTool) {
    const Dictionary entry{{"_id_", "--help"}, {"_obsoleteid_", true}};
    EXPECT_EQ(refused("cameras", entry), path("configuration.cameras.0._id_"));
    changeCamera(entry);
    EXPECT_EQ(root.read("/calls"), "--remove_camera --help\n");
}

TEST_F(RefusedRequests, ShortNameThatBeginsWithAHyphenWouldBeAnOptionOfTheTool) {
    const Dictionary entry{
        {"_id_", "C-1"},
        {"allowedUsersAndGroups",
         Array{Value(Dictionary{{"_newid_", true}, {"type", "user"}, {"shortName", "--resource_uuid"}})}}};
    EXPECT_EQ(refused("cameras", entry), path("configuration.cameras.0.allowedUsersAndGroups.0.shortName"));
    changeCamera(entry);
    EXPECT_THAT(root.read("/calls"), HasSubstr("--shortname --resource_uuid"));
}

TEST_F(RefusedRequests, UnknownKeysAndKeysThatChangeNothingPass) {
    EXPECT_EQ(
        refused("properties", {{"_id_", "1"}, {"value", "fine"}, {"description", "a \"quoted\" text"}, {"x", "\""}}),
        std::vector<std::string>{});
    EXPECT_EQ(refused("properties", {{"_obsoleteid_", true}, {"_id_", "1"}, {"name", "with \"quotes\""}}),
              std::vector<std::string>{});
}

}  // namespace
}  // namespace lumio
