#include "resources/Resource.h"
#include "settings/QueryRunner.h"
#include "settings/SettingsStore.h"
#include "tests/support/TemporaryRoot.h"

#include <chrono>
#include <cstdio>
#include <filesystem>
#include <thread>

#include <gtest/gtest.h>

namespace lumio {
namespace {

using adminhost::Dictionary;
using adminhost::Error;
using Records = std::vector<Dictionary>;

constexpr std::string_view database = "/Library/SorvaneProducer/Shared/Server/db.sqlite3";

TEST(LineOutput, SingleLineWithLineFeedIsOneRecord) {
    EXPECT_EQ(recordsOfLineOutput("count(*) = 3\n"), (Records{{{"count(*)", "3"}}}));
}

TEST(LineOutput, EmptyLinesEmitRecordsAndPaddingIsStripped) {
    // Six elements after splitting at line feeds, the last one empty.
    EXPECT_EQ(recordsOfLineOutput("   id = 5\nname = a = b\n\n   id = 6\nname = c\n"),
              (Records{{{"id", "5"}, {"name", "a = b"}}, {{"id", "6"}, {"name", "c"}}}));
}

TEST(LineOutput, EveryEmptyLineEmitsAlsoAnEmptyRecord) {
    EXPECT_EQ(recordsOfLineOutput("   id = 5\n\n   id = 6\n\n"), (Records{{{"id", "5"}}, {{"id", "6"}}, {}}));
    EXPECT_EQ(recordsOfLineOutput("\n"), (Records{{}, {}}));
}

TEST(LineOutput, NullColumnIsTheEmptyText) {
    EXPECT_EQ(recordsOfLineOutput(" name = \n"), (Records{{{"name", ""}}}));
}

TEST(LineOutput, LineWithoutSeparatorIsItsOwnValueUnderItsLastWord) {
    EXPECT_EQ(recordsOfLineOutput("value = first\nsecond line\n"),
              (Records{{{"value", "first"}, {"line", "second line"}}}));
    EXPECT_EQ(recordsOfLineOutput("value = first\nsecond\n"), (Records{{{"value", "first"}, {"second", "second"}}}));
}

TEST(LineOutput, OnlyAnEqualsSignBetweenBlanksSeparates) {
    EXPECT_EQ(recordsOfLineOutput("a=b = c=d\na= = e= = f\n"), (Records{{{"a=b", "c=d"}, {"a=", "e= = f"}}}));
    EXPECT_EQ(recordsOfLineOutput("x =\n= y\n=\n"), (Records{{{"=", "="}, {"y", "= y"}}}));
    EXPECT_EQ(recordsOfLineOutput(" = z\n"), (Records{{{"", "z"}}}));
}

TEST(LineOutput, ValueWithAnEmptyLineEndsTheRecordEarly) {
    EXPECT_EQ(recordsOfLineOutput("   id = 1\nvalue = a\n\nb\n"),
              (Records{{{"id", "1"}, {"value", "a"}}, {{"b", "b"}}}));
}

TEST(LineOutput, ColumnNameWithASpaceIsStoredUnderItsLastWord) {
    EXPECT_EQ(recordsOfLineOutput("full name = x\n"), (Records{{{"name", "x"}}}));
}

TEST(LineOutput, OnlyBlanksEndTheSearchForAKeysBeginning) {
    // A tab is part of the key; so is everything before it up to the last blank.
    EXPECT_EQ(recordsOfLineOutput("\tname = x\n  a\tb = y\n\t = z\n"),
              (Records{{{"\tname", "x"}, {"a\tb", "y"}, {"\t", "z"}}}));
    EXPECT_EQ(recordsOfLineOutput("name\t=\tx\n"), (Records{{{"name\t=\tx", "name\t=\tx"}}}));
}

TEST(LineOutput, LaterLineWithTheSameKeyReplacesTheValue) {
    EXPECT_EQ(recordsOfLineOutput("a = 1\na = 2\n"), (Records{{{"a", "2"}}}));
}

TEST(LineOutput, OutputWithoutTrailingLineFeedDropsItsLastRecord) {
    EXPECT_EQ(recordsOfLineOutput("id = 1\n\nid = 2"), (Records{{{"id", "1"}}}));
    EXPECT_EQ(recordsOfLineOutput("id = 1"), Records{});
    EXPECT_EQ(recordsOfLineOutput(""), Records{});
}

class QueryRunner : public testing::Test {
  protected:
    void SetUp() override {
        root.sql(database,
                 "create table t(id integer primary key, name text unique, note);"
                 "insert into t values(5,'a = b',NULL),(6,'c','two' || char(10) || 'lines');");
    }
    std::optional<Records> run(const std::string& statement) {
        auto rows = runStatement(statement);
        error = rows ? std::nullopt : std::optional(rows.error());
        return rows ? std::optional(*std::move(rows)) : std::nullopt;
    }

    adminhost::test::TemporaryRoot root;
    std::optional<Error> error;
};

TEST_F(QueryRunner, RowsOfTheRealToolArriveAsTexts) {
    EXPECT_EQ(run("select id,name,note from t"),
              (Records{{{"id", "5"}, {"name", "a = b"}, {"note", ""}},
                       {{"id", "6"}, {"name", "c"}, {"note", "two"}, {"lines", "lines"}}}));
    EXPECT_EQ(run("select count(*) from t"), (Records{{{"count(*)", "2"}}}));
    EXPECT_EQ(error, std::nullopt);
}

TEST_F(QueryRunner, StatementThatPrintsNothingIsAnEmptyListAndNoError) {
    EXPECT_EQ(run("update t set note='x' where id=5"), Records{});
    EXPECT_EQ(run("select * from t where id=99"), Records{});
    EXPECT_EQ(error, std::nullopt);
}

TEST_F(QueryRunner, FailingStatementIsNothingWithTheToolsStatusAndText) {
    EXPECT_EQ(run("select * from missing"), std::nullopt);
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, "sqliteQuery");
    EXPECT_EQ(error->code, 1);
    EXPECT_TRUE(error->description->starts_with("Can't execute sqlite3 query: ")) << *error->description;
    EXPECT_NE(error->description->find("no such table: missing"), std::string::npos) << *error->description;
}

TEST_F(QueryRunner, ErrorCarriesTheToolsWholeTextAndExitStatus) {
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\necho 'id = 1'\nprintf 'Error: %%s\\n  here ^\\n' >&2\nexit 255\n");
    EXPECT_EQ(run("select 1"), std::nullopt);
    EXPECT_EQ(error, (Error{"sqliteQuery", 255, "Can't execute sqlite3 query: Error: %s\n  here ^\n"}));
}

TEST_F(QueryRunner, ConstraintViolationIsAnErrorAndChangesNothing) {
    EXPECT_EQ(run("insert into t values(7,'c',NULL)"), std::nullopt);
    ASSERT_TRUE(error);
    EXPECT_NE(error->code, 0);
    EXPECT_EQ(root.sql(database, "select count(*) from t"), "2\n");
}

TEST_F(QueryRunner, RowsPrintedBeforeAFailureAreDropped) {
    EXPECT_EQ(run("select 1 as a; select * from missing"), std::nullopt);
    EXPECT_TRUE(error);
}

TEST_F(QueryRunner, ToolThatCannotBeStartedIsMinusOne) {
    std::filesystem::remove(root.path("/usr/bin/sqlite3"));
    EXPECT_EQ(run("select 1"), std::nullopt);
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code, -1);
}

TEST_F(QueryRunner, ToolKilledByASignalIs128PlusItsNumber) {
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nkill -9 $$\n");
    EXPECT_EQ(run("select 1"), std::nullopt);
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code, 137);
}

TEST_F(QueryRunner, ToolGetsExactlyLineModeDatabaseAndStatement) {
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\nprintf 'n = %s\\n' $#\nprintf 'argument = <%s>\\n\\n' \"$@\"\n");
    const auto records = run("select 'it''s; $HOME `x`' -- \"q\"");
    ASSERT_TRUE(records);
    ASSERT_EQ(records->size(), 4U);
    EXPECT_EQ((*records)[0], (Dictionary{{"n", "3"}, {"argument", "<-line>"}}));
    EXPECT_EQ((*records)[1], (Dictionary{{"argument", "<" + root.path(database).string() + ">"}}));
    EXPECT_EQ((*records)[2], (Dictionary{{"argument", "<select 'it''s; $HOME `x`' -- \"q\">"}}));
    EXPECT_EQ((*records)[3], Dictionary{});
}

TEST_F(QueryRunner, RelativeDatabaseIsTheOneThatWasFoundBelowTheSystemRoot) {
    root.write("/var/lumio/server/database.yml", "production:\n  database: db/prod.sqlite3\n");
    root.sql("/db/prod.sqlite3", "create table t(id); insert into t values(99)");
    const auto records = run("select id from t");
    EXPECT_TRUE(SettingsStore::dbPathExists());
    EXPECT_EQ(records, (Records{{{"id", "99"}}}));
}

TEST_F(QueryRunner, AMegabyteOnEachStreamIsCaptured) {
    root.writeTool(
        "/usr/bin/sqlite3",
        "#!/bin/sh\nhead -c 1000000 /dev/zero | tr '\\0' e >&2 &\nprintf 'v = '\nhead -c 1000000 /dev/zero | tr "
        "'\\0' o\nprintf '\\n'\nwait\nexit $(cat \"$2.exit\" 2>/dev/null || echo 0)\n");
    const auto records = run("x");
    ASSERT_TRUE(records);
    EXPECT_EQ((*records)[0].get("v").string()->size(), 1000000U);
    root.write(std::string(database) + ".exit", "3");
    EXPECT_EQ(run("x"), std::nullopt);
    EXPECT_EQ(error->code, 3);
    EXPECT_GE(error->description->size(), 1000000U);
}

TEST_F(QueryRunner, DatabaseThatBeginsWithAHyphenIsAFailureAndNoOptionOfTheTool) {
    root.write("/var/lumio/server/database.yml", "production:\n  database: -cmd\n");
    root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\ntouch '" + root.path("/ran").string() + "'\n");
    EXPECT_EQ(run(".shell true"), std::nullopt);
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, "sqliteQuery");
    EXPECT_EQ(error->code, 1);
    EXPECT_NE(error->description->find("hyphen"), std::string::npos) << *error->description;
    EXPECT_FALSE(std::filesystem::exists(root.path("/ran")));
}

TEST_F(QueryRunner, MissingDatabaseIsTheToolsFailureWithCode1) {
    std::filesystem::remove(root.path(database));
    EXPECT_EQ(run("select * from t"), std::nullopt);
    ASSERT_TRUE(error);
    EXPECT_EQ(error->domain, "sqliteQuery");
    EXPECT_EQ(error->code, 1);
    error.reset();
    std::filesystem::remove_all(root.path(database).parent_path());
    EXPECT_EQ(run("select * from t"), std::nullopt);
    ASSERT_TRUE(error);
    EXPECT_EQ(error->code, 1);
    EXPECT_NE(error->description->find("unable to open database"), std::string::npos) << *error->description;
}

TEST_F(QueryRunner, CorruptDatabaseIsAnError) {
    root.write(database, std::string(4096, 'x'));
    EXPECT_EQ(run("select * from t"), std::nullopt);
    EXPECT_TRUE(error);
}

TEST_F(QueryRunner, LockedDatabaseIsAnErrorAtOnce) {
    // A second process holds the exclusive lock until it has read its input to the end.
    const std::string command = "exec /usr/bin/sqlite3 '" + root.path(database).string() + "'";
    std::FILE* holder = ::popen(command.c_str(), "we");  // NOLINT(cert-env33-c): a test's own fixed command
    ASSERT_NE(holder, nullptr);
    std::fprintf(holder, "begin exclusive;\n.once '%s'\nselect 1;\n", root.path("/locked").c_str());
    std::fflush(holder);
    const auto bound = std::chrono::steady_clock::now() + std::chrono::seconds(10);
    while (root.read("/locked").empty() && std::chrono::steady_clock::now() < bound) {
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    EXPECT_EQ(root.read("/locked"), "1\n");
    EXPECT_EQ(run("select * from t"), std::nullopt);
    EXPECT_EQ(::pclose(holder), 0);
    ASSERT_TRUE(error);
    EXPECT_NE(error->description->find("locked"), std::string::npos) << *error->description;
    EXPECT_TRUE(run("select * from t"));
}

TEST_F(QueryRunner, DoubleQuotedTextThatNamesAColumnIsReadAsTheColumn) {
    // Values are inserted verbatim: a double-quoted text equal to a column's name is that column, so every row matches.
    EXPECT_EQ(run("select id from t where name=\"name\"")->size(), 2U);
    EXPECT_EQ(run("select id from t where name=\"c\"")->size(), 1U);
}

TEST_F(QueryRunner, ResultClassesAreDictionariesOrResources) {
    const auto rows = Resource::querySorvaneDatabase<Dictionary>("select id from t where id=5", error);
    ASSERT_TRUE(rows);
    EXPECT_EQ(rows->front(), (Dictionary{{"id", "5"}}));
}

}  // namespace
}  // namespace lumio
