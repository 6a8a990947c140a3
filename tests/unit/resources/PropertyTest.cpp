#include "platform/text/LocalDate.h"
#include "platform/value/ValueText.h"
#include "tests/unit/resources/PropertyFixture.h"

#include <filesystem>

namespace lumio {
namespace {

using adminhost::Array;

class PropertyTest : public PropertyFixture {};

TEST_F(PropertyTest, ListingHasBooleansDatesAndIdentityAndNoProtectedValue) {
    sql("insert into properties values(7,'open','shown','f','2026-01-31 08:00:00','never'),"
        "(8,'closed','aGlkZGVu','t','2026-01-31 08:00:00','2026-01-31 09:00:00'),(9,'odd',NULL,'T',NULL,NULL);");
    const std::vector<Dictionary> records = listed();
    ASSERT_EQ(records.size(), 3U);
    EXPECT_EQ(records[0], (Dictionary{{"id", "7"},
                                      {"_id_", "7"},
                                      {"name", "open"},
                                      {"value", "shown"},
                                      {"protect", false},
                                      {"created_at", *adminhost::localDateOf("2026-01-31 08:00:00")},
                                      {"updated_at", "never"}}));
    EXPECT_EQ(records[1], (Dictionary{{"id", "8"},
                                      {"_id_", "8"},
                                      {"name", "closed"},
                                      {"protect", true},
                                      {"created_at", *adminhost::localDateOf("2026-01-31 08:00:00")},
                                      {"updated_at", *adminhost::localDateOf("2026-01-31 09:00:00")}}));
    EXPECT_EQ(records[2].get("protect"), Value(false));  // only the text t is protected
    EXPECT_EQ(records[2].get("value"), Value(""));
}

TEST_F(PropertyTest, ListingOfAnEmptyTableIsEmpty) {
    EXPECT_TRUE(listed().empty());
}

TEST_F(PropertyTest, ListingThatFailsAnswersTheErrorAndLogsIt) {
    sql("drop table properties");
    std::optional<Error> error;
    EXPECT_FALSE(Property::allPropertiesWithError(error));
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, "sqliteQuery");
    EXPECT_EQ(log.lines, std::vector<std::string>{"Error getting Sorvane workflow properties: " + textOf(*error)});
    EXPECT_FALSE(Property::allPropertiesUsingLocalizations({}, error));
}

TEST_F(PropertyTest, UsedAtIsNoDateOfAProperty) {
    const auto property = Property::initWithDictionary({{"used_at", "2026-01-31 08:00:00"}});
    EXPECT_EQ(property->dictionary()->get("used_at"), Value("2026-01-31 08:00:00"));
    EXPECT_EQ(property->changeValues(), std::nullopt);
    EXPECT_EQ(property->resourceType(), "property");
}

TEST_F(PropertyTest, InsertWithoutProtectStoresF) {
    EXPECT_EQ(insert({{"name", "n"}, {"value", "v"}}), std::nullopt);
    EXPECT_EQ(row("id,name,value,protect"), "1|n|v|f");
    EXPECT_EQ(row("created_at=updated_at and created_at glob '20[0-9][0-9]-[01][0-9]-[0-3][0-9] [0-2][0-9]:*'"), "1");
}

TEST_F(PropertyTest, InsertWithProtectStoresTAndNeverThePlainText) {
    EXPECT_EQ(insert({{"name", "n"}, {"value", "open sesame"}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(row("name,value,protect"), "n|" + protectedByOpenssl("open sesame") + "|t");
    EXPECT_EQ(root.read(databasePath).find("sesame"), std::string::npos);
}

TEST_F(PropertyTest, ProtectGivenAsTextIsReadAsABoolean) {
    for (const auto& [text, stored] :
         {std::pair{" yes", "t"}, {"t", "t"}, {"1", "t"}, {"f", "f"}, {"no", "f"}, {"01", "f"}}) {
        sql("delete from properties");
        EXPECT_EQ(insert({{"name", "n"}, {"protect", text}}), std::nullopt);
        EXPECT_EQ(row("protect"), stored) << text;
    }
}

TEST_F(PropertyTest, InsertTakesTheTablesColumnsOnlyIdIncluded) {
    EXPECT_EQ(insert({{"_newid_", true}, {"id", 42}, {"name", "n"}, {"description", "d"}, {"_id_", "9"}, {"value", 5}}),
              std::nullopt);
    EXPECT_EQ(row("id,name,value,protect"), "42|n|5|f");
}

TEST_F(PropertyTest, InsertWithoutAValueStoresNone) {
    EXPECT_EQ(insert({{"name", "n"}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(row("value is null,protect"), "1|t");
}

TEST_F(PropertyTest, SecondPropertyOfANameIsRefusedAndNothingWritten) {
    ASSERT_EQ(insert({{"name", "n"}, {"value", "first"}}), std::nullopt);
    const auto error = insert({{"name", "n"}, {"value", "second"}});
    EXPECT_EQ(error, (Error{"sqliteQuery", 2, "Property name 'n' already exists with value 'first'"}));
    EXPECT_EQ(row("value"), "first");
    EXPECT_TRUE(log.lines.empty());
}

TEST_F(PropertyTest, NameErrorCarriesTheLastRowsStoredProtectedText) {
    sql("insert into properties(name,value,protect) values('n','one','f')");
    const std::string wrapped = std::string(76, 'A') + "\n" + std::string(76, 'B') + "\n";
    sql("insert into properties(name,value,protect) values('n','" + wrapped + "','t')");
    const auto error = insert({{"name", "n"}});
    ASSERT_TRUE(error);
    EXPECT_EQ(error->description, "Property name 'n' already exists with value '" + wrapped + "'");
}

TEST_F(PropertyTest, RenamingToItsOwnNameSucceedsAndToAnotherPropertysDoesNot) {
    sql("insert into properties(id,name,value,protect) values(1,'a','va','f'),(2,'b','vb','f')");
    EXPECT_EQ(change({{"_id_", "1"}, {"name", "a"}, {"value", "new"}}), std::nullopt);
    EXPECT_EQ(sql("select value from properties where id=1"), "new\n");
    const auto error = change({{"_id_", "1"}, {"name", "b"}});
    EXPECT_EQ(error, (Error{"sqliteQuery", 2, "Property name 'b' already exists with value 'vb'"}));
    EXPECT_EQ(sql("select name from properties where id=1"), "a\n");
}

TEST_F(PropertyTest, ChangeStoresTheTablesColumnsAndLeavesCreatedAtAndId) {
    sql("insert into properties values(3,'n','v','f','2000-01-01 00:00:00','2000-01-01 00:00:00')");
    EXPECT_EQ(
        change({{"_id_", 3}, {"_id", "x"}, {"id", 99}, {"created_at", "now"}, {"description", "d"}, {"value", "w"}}),
        std::nullopt);
    EXPECT_EQ(row("id,name,value,protect,created_at,updated_at>created_at"), "3|n|w|f|2000-01-01 00:00:00|1");
}

TEST_F(PropertyTest, ChangeRequestKeepsItsValuesWithoutTheShortIdentityKey) {
    sql("insert into properties(id,name,value,protect) values(3,'n','v','t')");
    const auto property = Property::initWithChangeRequest({{"_id_", "3"}, {"_id", "x"}, {"value", "w"}});
    EXPECT_EQ(property->changeValues(), (Dictionary{{"_id_", "3"}, {"value", "w"}}));
    EXPECT_EQ(property->dictionary()->get("protect"), Value("t"));  // raw
    EXPECT_EQ(property->dictionary()->get("value"), Value("v"));
    const auto without = Property::initWithChangeRequest({{"_id", "x"}});
    EXPECT_EQ(without->changeValues(), (Dictionary{{"_id", "x"}}));
    EXPECT_EQ(without->dictionary(), nullptr);
}

TEST_F(PropertyTest, ChangeWithoutIdentityMatchesNoRowAndReportsSuccess) {
    sql("insert into properties(id,name,value,protect) values(1,'n','v','f')");
    EXPECT_EQ(change({{"value", "w"}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "77"}, {"value", "w"}}), std::nullopt);
    EXPECT_EQ(row("value"), "v");
}

TEST_F(PropertyTest, NewValueOfAProtectedPropertyIsStoredProtected) {
    ASSERT_EQ(insert({{"name", "n"}, {"value", "old"}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "1"}, {"value", "new"}}), std::nullopt);
    EXPECT_EQ(row("value,protect"), protectedByOpenssl("new") + "|t");
}

TEST_F(PropertyTest, ProtectionSwitchedOnWithoutAValueProtectsTheStoredOne) {
    ASSERT_EQ(insert({{"name", "n"}, {"value", "plain"}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(row("value,protect"), protectedByOpenssl("plain") + "|t");
}

TEST_F(PropertyTest, ProtectionSwitchedOffWithoutAValueStoresThePlainOne) {
    ASSERT_EQ(insert({{"name", "n"}, {"value", "plain"}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", false}}), std::nullopt);
    EXPECT_EQ(row("value,protect"), "plain|f");
}

TEST_F(PropertyTest, ProtectionSwitchedOffWithAValueStoresThatValue) {
    ASSERT_EQ(insert({{"name", "n"}, {"value", "old"}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", "f"}, {"value", "new"}}), std::nullopt);
    EXPECT_EQ(row("value,protect"), "new|f");
}

TEST_F(PropertyTest, ProtectionSwitchedOffStillStoresFWhenTheValueCannotBeDeciphered) {
    sql("insert into properties(name,value,protect) values('n','no cipher text','t')");
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", false}}), std::nullopt);
    EXPECT_EQ(row("value,protect"), "no cipher text|f");
    EXPECT_EQ(log.lines, std::vector<std::string>{"no convertedValueData from aes128cbc..."});
}

TEST_F(PropertyTest, ProtectingAProtectedValueAgainEncryptsItTwice) {
    ASSERT_EQ(insert({{"name", "n"}, {"value", "plain"}, {"protect", true}}), std::nullopt);
    const std::string once = storedValue();
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(storedValue(), protectedByOpenssl(once));
    EXPECT_EQ(Property::decryptValue(storedValue()), once);
}

TEST_F(PropertyTest, WithoutAKeyFileEveryProtectedWriteFailsAndWritesNothing) {
    sql("insert into properties(name,value,protect) values('p','cGxhaW4=','t'),('q','plain','f')");
    std::filesystem::remove(root.path(keyPath));
    const Error cannot{"LumioPropertyCantEncryptValue", 1, std::nullopt};
    const std::string before = sql("select * from properties");
    EXPECT_EQ(insert({{"name", "n"}, {"value", "secret"}, {"protect", true}}), cannot);
    EXPECT_EQ(change({{"_id_", "1"}, {"value", "secret"}}), cannot);
    EXPECT_EQ(change({{"_id_", "2"}, {"protect", true}}), cannot);
    EXPECT_EQ(sql("select * from properties"), before);
    EXPECT_EQ(log.lines, std::vector<std::string>(3, "failed to load /shared/Server/Secrets/kek.plist"));
}

TEST_F(PropertyTest, DoubleQuoteInAValueMakesTheInsertFail) {
    const auto error = insert({{"name", "n"}, {"value", "a\"b"}});
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, "sqliteQuery");
    EXPECT_EQ(error->code, 1);
    EXPECT_TRUE(error->description->starts_with("Can't execute sqlite3 query: "));
    EXPECT_EQ(sql("select count(*) from properties"), "0\n");
    ASSERT_EQ(log.lines.size(), 1U);
    EXPECT_TRUE(log.lines[0].starts_with(
        "error writing property:\n{\n    name = n;\n    value = a\"b;\n    protect = 0;\n}\n   error: " +
        textOf(*error)));
}

TEST_F(PropertyTest, NameCheckThatFailsInTheToolIsReportedAlthoughTheWriteSucceeded) {
    root.writeTool("/usr/bin/sqlite3",
                   "#!/bin/sh\ncase \"$3\" in 'select id,name,value'*) echo 'Error: busy' >&2; exit 5;; esac\n"
                   "exec /usr/bin/sqlite3 \"$@\"\n");
    const auto error = insert({{"name", "n"}, {"value", "v"}});
    EXPECT_EQ(error, (Error{"sqliteQuery", 5, "Can't execute sqlite3 query: Error: busy\n"}));
    ASSERT_EQ(log.lines.size(), 1U);
    EXPECT_TRUE(log.lines[0].starts_with("error writing property:\n"));
    std::filesystem::remove(root.path("/usr/bin/sqlite3"));
    std::filesystem::create_symlink("/usr/bin/sqlite3", root.path("/usr/bin/sqlite3"));
    EXPECT_EQ(row("name,value"), "n|v");
}

TEST_F(PropertyTest, DeletingRemovesTheRowAndANullIdNothing) {
    sql("insert into properties(id,name) values(1,'a'),(2,'b'),(3,'c')");
    EXPECT_EQ(Property::deletePropertyWithID({}), std::nullopt);
    EXPECT_EQ(Property::deletePropertyWithID("2"), std::nullopt);
    EXPECT_EQ(Property::deletePropertyWithID(77), std::nullopt);
    EXPECT_EQ(sql("select id from properties"), "1\n3\n");
    EXPECT_EQ(Property::initWithDictionary({{"id", "3"}})->delete_(), std::nullopt);
    EXPECT_EQ(Property::initWithDictionary({{"name", "a"}})->delete_(), std::nullopt);
    EXPECT_EQ(sql("select id from properties"), "1\n");
}

TEST_F(PropertyTest, DeletingThatFailsAnswersAndLogsTheError) {
    sql("drop table properties");
    const auto error = Property::deletePropertyWithID("5");
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, "sqliteQuery");
    const auto sameError = Property::initWithDictionary({{"id", "5"}})->delete_();
    EXPECT_EQ(sameError, error);
    EXPECT_EQ(log.lines,
              (std::vector<std::string>{
                  "error deleting property with ID:\n5\n  error:: " + textOf(*error),
                  "error deleting property:\n{\n    id = 5;\n    protect = 0;\n    _id_ = 5;\n}\n  error:: " +
                      textOf(*error)}));
}

TEST_F(PropertyTest, RecordIsAppendedToTheArray) {
    Array array;
    Property::initWithDictionary({{"id", "5"}})->addDataDictionaryToMutableArray(array);
    Property::init()->addDataDictionaryToMutableArray(array);
    const Value record = Dictionary{{"id", "5"}, {"protect", false}, {"_id_", "5"}};
    EXPECT_EQ(array, Array{record});
    const auto property = Property::initWithDictionary({{"id", "5"}});
    property->addDataDictionaryToMutableArray(array);
    EXPECT_NE(property->dictionary()->size(), 0U);
    std::move(*property).addDataDictionaryToMutableArray(array);
    std::move(*Property::init()).addDataDictionaryToMutableArray(array);
    EXPECT_EQ(array, (Array{record, record, record}));
}

TEST_F(PropertyTest, IdForANameIsTheOnlyRowsOne) {
    sql("insert into properties(id,name) values(1,'a'),(2,'b'),(3,'b')");
    const auto property = Property::init();
    EXPECT_EQ(property->getIDForName("a", "properties"), 1);
    EXPECT_EQ(property->getIDForName("b", "properties"), std::nullopt);
    EXPECT_EQ(property->getIDForName("c", "properties"), std::nullopt);
    EXPECT_EQ(property->getIDForName("a", "missing"), std::nullopt);
    const std::string nothing = "getIDForName:fromTable: found nothing for this query: ";
    ASSERT_EQ(log.lines.size(), 6U);
    EXPECT_TRUE(log.lines[0].starts_with("idForNAme result: (\n"));
    EXPECT_TRUE(log.lines[1].starts_with("idForNAme result: (\n"));
    EXPECT_EQ(log.lines[2], nothing + "select id from properties where name='c';");
    EXPECT_EQ(log.lines[3], "idForNAme result: (\n)");
    EXPECT_EQ(log.lines[4], nothing + "select id from missing where name='a';");
    EXPECT_EQ(log.lines[5], "idForNAme result: (null)");
}

TEST_F(PropertyTest, DescriptionsComeInTheAskedLanguageAndElseInEnglish) {
    const std::string bundle =
        "/System/Library/SorvaneProducer/SorvaneProducerServerLocalizations.bundle/Contents/Resources/";
    EXPECT_EQ(Property::descriptionsForLocalizations({"de"}), std::nullopt);
    root.write(bundle + "English.lproj/PropertyDescriptions.strings", "\"n\" = \"number\"; \"m\" = \"more\";");
    root.write(bundle + "German.lproj/PropertyDescriptions.strings", "\"n\" = \"Nummer\";");
    root.write(bundle + "fr.lproj/PropertyDescriptions.strings", "\"n\" = \"num\\U00e9ro\";");
    sql("insert into properties(id,name) values(1,'n'),(2,'m')");
    std::optional<Error> error;
    const auto descriptions = [&](const std::vector<std::string>& languages) {
        std::vector<std::string> texts;
        const auto properties = Property::allPropertiesUsingLocalizations(languages, error);
        for (const auto& property : properties.value()) {
            texts.push_back(textOf(property->dictionary()->get("description")));
        }
        return texts;
    };
    using Texts = std::vector<std::string>;
    EXPECT_EQ(descriptions({"French", "German"}), (Texts{"num\xC3\xA9ro", "(null)"}));
    EXPECT_EQ(descriptions({"it", "de_AT"}), (Texts{"Nummer", "(null)"}));
    EXPECT_EQ(descriptions({"it"}), (Texts{"number", "more"}));
    EXPECT_EQ(descriptions({}), (Texts{"number", "more"}));
    EXPECT_FALSE(error);
}

}  // namespace
}  // namespace lumio
