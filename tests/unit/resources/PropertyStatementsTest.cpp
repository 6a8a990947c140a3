// The statements of properties, compared to the letter: they are part of the service's contract.

#include "codec/LumioCategories.h"
#include "handler/LumioRequestHandler.h"
#include "platform/value/ValueText.h"
#include "tests/support/Environment.h"
#include "tests/support/RecordedStatements.h"
#include "tests/unit/resources/PropertyFixture.h"

#include <chrono>
#include <ctime>

#include <gmock/gmock.h>

namespace lumio {
namespace {

using adminhost::Array;
using testing::ElementsAre;
using testing::IsEmpty;

std::string base64Of(std::string_view text) {
    return base64EncodedString({reinterpret_cast<const std::uint8_t*>(text.data()), text.size()});
}

class PropertyStatements : public PropertyFixture {
  protected:
    void SetUp() override {
        PropertyFixture::SetUp();
        sql("insert into properties(id,name,value,protect) values(3,'n','v','f')");
        statements.emplace(root);
    }

    std::optional<adminhost::test::RecordedStatements> statements;
};

TEST_F(PropertyStatements, ListingSelectsEverythingAndEndsInASemicolon) {
    (void)listed();
    EXPECT_THAT(statements->take(), ElementsAre("select * from properties;"));
}

TEST_F(PropertyStatements, InsertNamesTheKeysInTheTablesOrderAndQuotesEveryValue) {
    EXPECT_EQ(insert({{"value", "w"}, {"name", "m"}, {"other", 1}}), std::nullopt);
    EXPECT_THAT(statements->takeWithoutTimes(),
                ElementsAre("select id,name,value from properties where name=\"m\";",
                            "insert into properties (name,value,protect,updated_at,created_at) values "
                            "(\"m\",\"w\",\"f\",\"NOW\",\"NOW\")"));
}

TEST_F(PropertyStatements, InsertWithoutANameChecksNoName) {
    EXPECT_EQ(insert({{"id", 42}, {"value", 5}, {"protect", "no"}}), std::nullopt);
    EXPECT_THAT(statements->takeWithoutTimes(),
                ElementsAre("insert into properties (id,value,protect,updated_at,created_at) values "
                            "(\"42\",\"5\",\"f\",\"NOW\",\"NOW\")"));
}

TEST_F(PropertyStatements, UpdateSelectsAndUpdatesByTheUnquotedId) {
    EXPECT_EQ(change({{"value", "w"}, {"_id_", "3"}, {"name", "m"}, {"description", "d"}}), std::nullopt);
    EXPECT_THAT(statements->takeWithoutTimes(),
                ElementsAre("select * from properties where id = 3;",
                            "select id,name,value from properties where name=\"m\" and not id=3;",
                            "update properties set value=\"w\", name=\"m\", updated_at=\"NOW\" where id=3"));
}

TEST_F(PropertyStatements, UpdateWithoutIdentitySelectsNothingAndNamesANullId) {
    EXPECT_EQ(change({{"name", "m"}}), std::nullopt);
    EXPECT_THAT(statements->takeWithoutTimes(),
                ElementsAre("select id,name,value from properties where name=\"m\";",
                            "update properties set name=\"m\", updated_at=\"NOW\" where id=(null)"));
}

TEST_F(PropertyStatements, UpdateOfARowThatDoesNotExistNamesANullId) {
    EXPECT_EQ(change({{"_id_", 77}, {"name", "m"}}), std::nullopt);
    EXPECT_THAT(
        statements->takeWithoutTimes(),
        ElementsAre("select * from properties where id = 77;", "select id,name,value from properties where name=\"m\";",
                    "update properties set name=\"m\", updated_at=\"NOW\" where id=(null)"));
}

TEST_F(PropertyStatements, DeletingQuotesTheId) {
    EXPECT_EQ(Property::deletePropertyWithID(77), std::nullopt);
    EXPECT_EQ(Property::initWithDictionary({{"id", "3"}})->delete_(), std::nullopt);
    EXPECT_THAT(statements->take(),
                ElementsAre("delete from properties where id=\"77\"", "delete from properties where id=\"3\""));
}

TEST_F(PropertyStatements, DeletingWithoutAnIdRunsNothing) {
    EXPECT_EQ(Property::deletePropertyWithID({}), std::nullopt);
    EXPECT_EQ(Property::initWithDictionary({{"name", "n"}})->delete_(), std::nullopt);
    EXPECT_EQ(Property::init()->delete_(), std::nullopt);
    LumioRequestHandler handler;
    const Array changes{Dictionary{{"_obsoleteid_", true}}};
    (void)handler.processPropertyChangesWithRequest(&changes);
    EXPECT_THAT(statements->take(), IsEmpty());
    EXPECT_THAT(log.lines, IsEmpty());
}

TEST_F(PropertyStatements, LookUpOfANameQuotesItInSingleQuotes) {
    EXPECT_EQ(Property::init()->getIDForName("n", "properties"), 3);
    EXPECT_THAT(statements->take(), ElementsAre("select id from properties where name='n';"));
}

TEST_F(PropertyStatements, StampsOfTheRequestAreOverwritten) {
    EXPECT_EQ(insert({{"name", "m"}, {"created_at", "then"}, {"updated_at", "then"}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "3"}, {"created_at", "then"}, {"updated_at", "then"}}), std::nullopt);
    EXPECT_THAT(
        statements->takeWithoutTimes(),
        ElementsAre("select id,name,value from properties where name=\"m\";",
                    "insert into properties (name,created_at,updated_at,protect) values "
                    "(\"m\",\"NOW\",\"NOW\",\"f\")",
                    "select * from properties where id = 3;", "update properties set updated_at=\"NOW\" where id=3"));
}

TEST_F(PropertyStatements, StampsAreTheLocalTimeOfTheMachinesZone) {
    const support::ScopedEnvironment zone(support::ScopedEnvironment::Changes{{"TZ", "TST-9:30"}});
    ::tzset();
    const auto stamp = [](std::chrono::system_clock::time_point time) {
        const std::time_t shifted = std::chrono::system_clock::to_time_t(time + std::chrono::minutes(570));
        std::tm parts{};
        ::gmtime_r(&shifted, &parts);
        char text[32];
        return std::string(text, std::strftime(text, sizeof text, "%Y-%m-%d %H:%M:%S", &parts));
    };
    const std::string before = stamp(std::chrono::system_clock::now());
    EXPECT_EQ(change({{"_id_", "3"}, {"value", "w"}}), std::nullopt);
    EXPECT_EQ(insert({{"name", "m"}}), std::nullopt);
    const std::string after = stamp(std::chrono::system_clock::now());
    for (const std::string& written : {row("updated_at").substr(0, 19), sql("select created_at from properties where "
                                                                            "name='m'")
                                                                            .substr(0, 19)}) {
        EXPECT_GE(written, before);
        EXPECT_LE(written, after);
    }
}

TEST_F(PropertyStatements, StoredProtectionIsReadAsABooleanWhenAValueIsChanged) {
    for (const auto& [stored, isProtected] :
         {std::pair{"t", true}, {"T", true}, {"yes", true}, {"1", true}, {" y", true}, {"f", false}, {"", false}}) {
        sql("update properties set value='v',protect='" + std::string(stored) + "'");
        EXPECT_EQ(change({{"_id_", "3"}, {"value", "w"}}), std::nullopt);
        EXPECT_EQ(row("value"), isProtected ? protectedByOpenssl("w") : "w") << "stored protect: " << stored;
    }
}

TEST_F(PropertyStatements, BothLinesOfAnUpdateAreLoggedAroundTheLoad) {
    // The tool's own line in between: the row is loaded after the first line and before the second.
    LumioRequestHandler handler;
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nexit 1\n");
    root.writePropertyList(keyPath, "");
    const Array changes{Dictionary{{"_id_", "3"}, {"value", "w"}, {"protect", true}}};
    (void)handler.processPropertyChangesWithRequest(&changes);
    ASSERT_GE(log.lines.size(), 3U);
    EXPECT_EQ(log.lines[0], "adminhost_lumio: update property");
    EXPECT_EQ(log.lines[1], "adminhost_lumio: update property -> write");
    EXPECT_TRUE(log.lines.back().starts_with("adminhost_lumio: could not update property with id: 3, error: "));
}

TEST_F(PropertyStatements, DeletionThatFailsHidesAProtectedValueInItsLogLine) {
    sql("update properties set value='aGlkZGVu',protect='t'");
    const auto property = Property::initWithChangeRequest({{"_id_", "3"}});
    sql("create trigger keep before delete on properties begin select raise(abort,'kept'); end;");
    const auto error = property->delete_();
    ASSERT_TRUE(error);
    EXPECT_EQ(log.lines, std::vector<std::string>{
                             "error deleting property:\n{\n    id = 3;\n    name = n;\n    value = (secret);\n"
                             "    protect = t;\n    created_at = ;\n    updated_at = ;\n}\n  error:: " +
                             textOf(*error)});
}

TEST_F(PropertyStatements, FailedListingAddsNothing) {
    LumioRequestHandler handler;
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nexit 7\n");
    EXPECT_EQ(handler.getPropertiesWithRequest({}).dictionary(), (Dictionary{{"readStatus", 7}}));
    const adminhost::Response read =
        handler.readSettingsWithRequest({{"optionalArguments", Dictionary{{"variant", "getProperties"}}}});
    const Dictionary* configuration = read.dictionary().get("configuration").dictionary();
    ASSERT_NE(configuration, nullptr);
    EXPECT_FALSE(configuration->contains("properties"));
}

TEST_F(PropertyStatements, UnusableKeyOnInsertWritesNoRow) {
    useSecret("dG9vIHNob3J0");
    EXPECT_EQ(insert({{"name", "m"}, {"value", "hidden"}, {"protect", true}}),
              (Error{"LumioPropertyCantEncryptValue", 1, std::nullopt}));
    EXPECT_THAT(statements->take(), ElementsAre("select id,name,value from properties where name=\"m\";"));
    EXPECT_EQ(log.lines, std::vector<std::string>{"no convertedValueData from aes128cbc..."});
    EXPECT_EQ(sql("select count(*) from properties"), "1\n");
}

TEST_F(PropertyStatements, AnotherValidKeySpoilsThePaddingOrByChanceGivesAnotherText) {
    const std::string stored = *Property::encryptValue("open sesame");
    useSecret("QUJDREVGR0hJSktMTU5PUA==");
    EXPECT_EQ(Property::decryptValue(stored), std::nullopt);
    EXPECT_THAT(log.lines, ElementsAre("no convertedValueData from aes128cbc..."));
    log.lines.clear();
    // Under this key the padding comes out as one byte of 1, and the fifteen before it as UTF-8.
    useSecret(base64Of("other-0013598796"));
    const std::optional<std::string> text = Property::decryptValue(stored);
    ASSERT_TRUE(text);
    EXPECT_EQ(text->size(), 15U);
    EXPECT_NE(text, "open sesame");
    EXPECT_THAT(log.lines, IsEmpty());
}

}  // namespace
}  // namespace lumio
