// A failed change of a property loses no data and shows no secret.

#include "handler/LumioRequestHandler.h"
#include "platform/value/ValueText.h"
#include "resources/StatementText.h"
#include "tests/support/RecordedStatements.h"
#include "tests/unit/resources/PropertyFixture.h"

#include <filesystem>

#include <gmock/gmock.h>

namespace lumio {
namespace {

using adminhost::Array;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

class PropertyGuards : public PropertyFixture {
  protected:
    /// Stores a protected property with the id 1.
    void storeProtected(const std::string& plain) const {
        const std::string cipher = *Property::encryptValue(plain);
        root.write("/script", "insert into properties(id,name,value,protect) values(1,'n','" + cipher + "','t');\n");
        sql(".read " + root.path("/script").string());
    }
    /// The tool fails for statements that match a shell pattern.
    void failFor(const std::string& pattern) const {
        root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nprintf '%s\\036' \"$3\" >> '" +
                                               root.path("/statements").string() + "'\ncase \"$3\" in " + pattern +
                                               ") printf 'Error: database is locked' >&2; exit 5;; esac\n"
                                               "exec /usr/bin/sqlite3 \"$@\"\n");
    }
};

TEST_F(PropertyGuards, DecipheredTextThatNoStatementCanCarryStaysProtected) {
    const std::vector<std::pair<std::string, std::string>> texts{
        {"hidden\" where 1=1; delete from properties; --", "double quote"},
        {std::string("hidden\0text", 11), "NUL"},
        {std::string(95'001, 'x'), "95 kB"},
        {"Value", "column"},
        {"_ROWID_", "column"}};
    for (const auto& [plain, why] : texts) {
        sql("delete from properties");
        storeProtected(plain);
        const std::string before = sql("select * from properties");
        log.lines.clear();
        const adminhost::test::RecordedStatements statements(root);
        const auto error = change({{"_id_", "1"}, {"protect", false}});
        EXPECT_THAT(statements.take(), ElementsAre("select * from properties where id = 1;"));
        ASSERT_TRUE(error);
        EXPECT_EQ(error->domain, "sqliteQuery");
        EXPECT_THAT(*error->description, HasSubstr(why));
        EXPECT_THAT(*error->description, HasSubstr("the property stays protected"));
        EXPECT_EQ(sql("select * from properties"), before);
        ASSERT_EQ(log.lines.size(), 1U);
        EXPECT_TRUE(log.lines[0].starts_with("error writing property:\n"));
        EXPECT_FALSE(log.contains("hidden"));
    }
}

TEST_F(PropertyGuards, DecipheredTextOfTheLargestSizeIsStored) {
    storeProtected(std::string(95'000, 'x'));
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", false}}), std::nullopt);
    EXPECT_EQ(row("length(value),protect"), "95000|f");
}

TEST_F(PropertyGuards, RowThatCannotBeLoadedIsTheErrorAndNoStatementFollows) {
    storeProtected("open sesame");
    const std::string before = sql("select * from properties");
    failFor("'select * from properties where'*");
    const adminhost::test::TemporaryRoot& files = root;
    const auto error = change({{"_id_", "1"}, {"name", "m"}, {"value", "new secret"}});
    EXPECT_EQ(error, (Error{"sqliteQuery", 5, "Can't execute sqlite3 query: Error: database is locked"}));
    EXPECT_EQ(files.read("/statements"), "select * from properties where id = 1;\036");
    EXPECT_THAT(log.lines, ElementsAre("error writing property:\n(null)\n   error: sqliteQuery (5): Can't execute "
                                       "sqlite3 query: Error: database is locked"));
    EXPECT_EQ(sql("select * from properties"), before);
}

TEST_F(PropertyGuards, RequestForARowThatCannotBeLoadedLogsTheErrorToo) {
    failFor("*");
    LumioRequestHandler handler;
    const Array changes{Dictionary{{"_id_", "1"}, {"value", "new"}}};
    (void)handler.processPropertyChangesWithRequest(&changes);
    EXPECT_THAT(log.lines,
                ElementsAre("adminhost_lumio: update property", "adminhost_lumio: update property -> write",
                            "error writing property:\n(null)\n   error: sqliteQuery (5): Can't execute sqlite3 query: "
                            "Error: database is locked",
                            "adminhost_lumio: could not update property with id: 1, error: sqliteQuery (5): Can't "
                            "execute sqlite3 query: Error: database is locked"));
}

TEST_F(PropertyGuards, ChangeThatMatchesNoRowShowsNoValueInItsArguments) {
    const adminhost::test::RecordedStatements statements(root);
    EXPECT_EQ(change({{"value", "hidden"}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "77"}, {"value", "hidden"}, {"name", "m"}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "77"}, {"value", "hidden"}, {"protect", true}}), std::nullopt);
    EXPECT_THAT(
        statements.takeWithoutTimes(),
        ElementsAre("update properties set updated_at=\"NOW\" where id=(null)",
                    "select * from properties where id = 77;", "select id,name,value from properties where name=\"m\";",
                    "update properties set name=\"m\", updated_at=\"NOW\" where id=(null)",
                    "select * from properties where id = 77;",
                    "update properties set protect=\"t\", updated_at=\"NOW\" where id=(null)"));
}

TEST_F(PropertyGuards, StoredIdThatIsNoNumberIsNotPutIntoAStatement) {
    sql("drop table properties; create table properties(id,name,value,protect,created_at,updated_at);"
        "insert into properties values('1 or 1=1','a','v','f','',''),(2,'b','v','f','','')");
    const auto property = Property::initWithChangeRequest({{"_id_", "'1 or 1=1'"}, {"value", "w"}});
    EXPECT_EQ(property->write(), std::nullopt);
    EXPECT_EQ(property->delete_(), std::nullopt);
    EXPECT_EQ(sql("select value from properties"), "v\nv\n");
    EXPECT_THAT(log.lines,
                ElementsAre("property: the record's id is not a number; it counts as a record without an id",
                            "property: the record's id is not a number; it counts as a record without an id"));
}

TEST_F(PropertyGuards, FailedUnprotectingHidesOnlyThePlainTextInTheToolsMessage) {
    const std::string plain = "open sesame, and then some more of it";
    storeProtected(plain);
    sql("create trigger refuse before update on properties begin select raise(abort,'kept'); end");
    const auto error = change({{"_id_", "1"}, {"protect", false}});
    ASSERT_TRUE(error);
    EXPECT_EQ(error->description, "Can't execute sqlite3 query: Error: stepping, kept (19)\n");
    EXPECT_FALSE(log.contains("sesame"));
}

TEST_F(PropertyGuards, PiecesOfThePlainTextInTheToolsExcerptAreHidden) {
    for (const std::size_t length : {10U, 40U, 70U, 300U}) {
        std::string plain;
        while (plain.size() < length) {
            plain += "pass" + std::to_string(plain.size()) + "\n";
        }
        sql("drop table properties; create table properties(id integer primary key,name,value,protect)");
        storeProtected(plain);
        log.lines.clear();
        const auto error = change({{"_id_", "1"}, {"protect", false}});
        ASSERT_TRUE(error);
        EXPECT_THAT(*error->description, HasSubstr("no such column: updated_at"));
        EXPECT_THAT(*error->description, Not(HasSubstr("pass"))) << length;
        EXPECT_FALSE(log.contains("pass"));
    }
}

TEST(WithoutSecret, HidesWholeTextsWordsAndExcerpts) {
    const std::string statement = "update properties set value=\"open\nsesame\", x=\"1\" where id=1";
    EXPECT_EQ(withoutSecret("no: open\nsesame!\n", "open\nsesame", statement), "no: (secret)!\n");
    EXPECT_EQ(withoutSecret("no: open sesame!", "open\nsesame", statement), "no: (secret)!");
    EXPECT_EQ(withoutSecret("Error\n  set value=\"open se\n   ^--- here", "open\nsesame", statement),
              "Error\n  set value=\"(secret)\n   ^--- here");
    EXPECT_EQ(withoutSecret("Error\n  esame\", x=\"1\" wh", "open\nsesame", statement),
              "Error\n  (secret)\", x=\"1\" wh");
    EXPECT_EQ(withoutSecret("Error near \"o\": no", "o", "set value=\"o\", x"), "Error near \"(secret)\": no");
    EXPECT_EQ(withoutSecret("database is locked", "", statement), "database is locked");
    EXPECT_EQ(withoutSecret("database is locked", "open\nsesame", "another"), "database is locked");
}

TEST_F(PropertyGuards, ListingsOfAMissingDatabaseFailWithoutCreatingIt) {
    LumioRequestHandler handler;
    std::filesystem::remove(root.path(databasePath));
    const adminhost::test::RecordedStatements statements(root);
    EXPECT_EQ(handler.getPropertiesWithRequest({}).dictionary(), (Dictionary{{"readStatus", 1}}));
    EXPECT_EQ(handler.getCamerasWithRequest({}).dictionary(), (Dictionary{{"readStatus", 1}}));
    EXPECT_THAT(statements.take(), IsEmpty());
    EXPECT_FALSE(std::filesystem::exists(root.path(databasePath)));
    EXPECT_THAT(log.lines, ElementsAre("Error getting Sorvane workflow properties: sqliteQuery (1): Can't execute "
                                       "sqlite3 query: Error: unable to open database \"/shared/Server/db.sqlite3\": "
                                       "unable to open database file\n"));
}

}  // namespace
}  // namespace lumio
