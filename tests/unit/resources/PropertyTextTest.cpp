// Values with any lines are read back as they were stored.

#include "platform/text/Utf8.h"
#include "platform/value/ValueText.h"
#include "tests/support/RecordedStatements.h"
#include "tests/unit/resources/PropertyFixture.h"

#include <random>

#include <gmock/gmock.h>

namespace lumio {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

std::string hexOf(std::string_view bytes) {
    constexpr const char* digits = "0123456789abcdef";
    std::string text;
    for (const char c : bytes) {
        const auto byte = static_cast<unsigned char>(c);
        text += {digits[byte >> 4U], digits[byte & 15U]};
    }
    return text;
}

constexpr const char* everything = "select * from properties;";
constexpr const char* exact =
    "select hex(id),hex(name),hex(value),hex(protect),hex(created_at),hex(updated_at) from properties;";

class PropertyText : public PropertyFixture {
  protected:
    /// Stores a row without the operations under test.
    void store(int id, std::string_view value, const char* protect = "f") const {
        sql("insert into properties(id,name,value,protect,created_at,updated_at) values(" + std::to_string(id) + ",'n" +
            std::to_string(id) + "',cast(x'" + hexOf(value) + "' as text),'" + protect +
            "','2026-01-31 08:00:00','2026-01-31 08:00:00')");
    }
    /// The tool's line output.
    [[nodiscard]] std::string outputOf(const char* statement) const {
        return adminhost::test::runProgram({"/usr/bin/sqlite3", "-line", root.path(databasePath).string(), statement})
            .output;
    }
    /// The value comes back from the listing and survives protection switched on and off.
    void expectKept(const std::string& value) {
        SCOPED_TRACE(value);
        sql("delete from properties; delete from sqlite_sequence;");
        store(1, value);
        store(2, "plain");
        const std::vector<Dictionary> records = listed();
        ASSERT_EQ(records.size(), 2U);
        EXPECT_EQ(records[0].get("value"), Value(value));
        EXPECT_EQ(records[0].get("id"), Value("1"));
        EXPECT_EQ(records[0].get("_id_"), Value("1"));
        EXPECT_EQ(records[0].size(), 7U);
        EXPECT_EQ(records[1].get("value"), Value("plain"));
        EXPECT_EQ(change({{"_id_", "1"}, {"protect", true}}), std::nullopt);
        EXPECT_EQ(change({{"_id_", "1"}, {"protect", false}}), std::nullopt);
        EXPECT_EQ(sql("select hex(value),protect from properties where id=1"),
                  sql("select hex(x'" + hexOf(value) + "')||'|f'"));
    }
};

TEST_F(PropertyText, TwoCertificatesSurviveProtection) {
    const std::string certificate =
        "-----BEGIN CERTIFICATE-----\nMIIBszCCAVmgAwIBAgIUQ2\nu7K5c1RZcWvV0kq==\n-----END CERTIFICATE-----\n";
    expectKept(certificate + certificate);
}

TEST_F(PropertyText, LinesThatLookLikeOtherThingsArePartOfTheValue) {
    for (const char* value :
         {"a\na\na", "first word\nsecond word\nthird word", "a = b\nc = d\na = e", "protect ", "protect\nupdated_at",
          "x\nid = 3", "x\nid = 3\nprotect = t\n", "\n\n\n", "a\n\n\nid = 9\n", " = \n = ", "tab\there\r\nand \x1b[1m",
          "x\n\nname = y\n\n", "\n   timeout= 5", "end\n"}) {
        expectKept(value);
    }
}

TEST_F(PropertyText, LinesThatLookExactlyLikeColumnsArePartOfTheValue) {
    for (const char* value :
         {"x\n   protect = t", "x\n   protect = t\ncreated_at = a\nupdated_at = b", "x\n        id = 3",
          "x\n\n        id = 3", "x\n\n        id = 3\n      name = y\n     value = z", "   protect = t",
          "x\n   timeout = 5",
          "x\n\n        id = 1\n      name = y\n     value = z\n   protect = f\ncreated_at = \n"
          "updated_at = "}) {
        expectKept(value);
    }
}

TEST_F(PropertyText, RowThatAnotherValueSpellsOutIsNotLoadedForAChange) {
    const std::string value =
        "a\n   protect = t\ncreated_at = b\nupdated_at = c\n\n        id = 3\n      name = y\n     value = z";
    store(1, value);
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", false}}), std::nullopt);
    EXPECT_EQ(sql("select id,name,protect,length(value) from properties"),
              "1|n1|f|" + std::to_string(value.size()) + "\n");
}

TEST_F(PropertyText, OneReadingNeedsNoFurtherStatement) {
    store(1, "-----BEGIN\nid = 3\n = \n\nprotect\n   protect= t\nlast\n");
    store(2, std::string(76, 'A') + "\n" + std::string(76, 'B') + "\n", "t");
    store(4, "x\n   timeout = 5");
    const adminhost::test::RecordedStatements statements(root);
    EXPECT_EQ(listed().size(), 3U);
    EXPECT_THAT(statements.take(), ElementsAre(everything));
}

TEST_F(PropertyText, TwoReadingsFetchTheExactRowsByOneFurtherStatement) {
    store(1, "x\n   protect = t");
    store(2, "y\nz");
    const adminhost::test::RecordedStatements statements(root);
    const std::vector<Dictionary> records = listed();
    ASSERT_EQ(records.size(), 2U);
    EXPECT_EQ(records[0].get("value"), Value("x\n   protect = t"));
    EXPECT_EQ(records[0].get("protect"), Value(false));
    EXPECT_EQ(records[1].get("value"), Value("y\nz"));
    EXPECT_THAT(statements.take(), ElementsAre(everything, exact));
    EXPECT_EQ(change({{"_id_", "1"}, {"value", "w"}}), std::nullopt);
    EXPECT_THAT(statements.takeWithoutTimes(),
                ElementsAre("select * from properties where id = 1;",
                            "select hex(id),hex(name),hex(value),hex(protect),hex(created_at),hex(updated_at) from "
                            "properties where id = 1;",
                            "update properties set value=\"w\", updated_at=\"NOW\" where id=1"));
}

TEST_F(PropertyText, IdThatComesTwiceFetchesTheExactRows) {
    // The first row's value spells out the rest of its row and then the second row: one reading, two rows with id 2.
    store(1, "x\n   protect = f\ncreated_at = a\nupdated_at = b\n\n        id = 2\n      name = y\n     value = z");
    store(2, "y");
    const adminhost::test::RecordedStatements statements(root);
    EXPECT_EQ(listed().size(), 2U);
    EXPECT_THAT(statements.take(), ElementsAre(everything, exact));
}

TEST_F(PropertyText, IdsOutOfOrderFetchTheExactRows) {
    // One reading each, with an id that no row has.
    for (const char* id : {"1", "9", "+3", "3x", "", "99999999999999999999"}) {
        SCOPED_TRACE(id);
        sql("delete from properties");
        store(2, "x\n   protect = f\ncreated_at = a\nupdated_at = b\n\n        id = " + std::string(id) +
                     "\n      name = y\n     value = z");
        store(4, "y");
        const adminhost::test::RecordedStatements statements(root);
        EXPECT_EQ(listed().size(), 2U);
        EXPECT_THAT(statements.take(), ElementsAre(everything, exact));
    }
}

TEST_F(PropertyText, RowThatAValueSpellsOutWithAFreeIdInOrderIsNotNoticedBecauseTheOutputIsTheSameAsForTwoRows) {
    store(1, "x");
    store(3, "z");
    const std::string two = outputOf(everything);
    sql("delete from properties");
    store(1,
          "x\n   protect = f\ncreated_at = 2026-01-31 08:00:00\nupdated_at = 2026-01-31 08:00:00\n\n"
          "        id = 3\n      name = n3\n     value = z");
    ASSERT_EQ(outputOf(everything), two) << "no reader of this text can distinguish the two tables";
    EXPECT_EQ(listed().size(), 2U);
    // A change reads the row by its id, and so exactly: the value that is kept is the stored one.
    const std::string stored = sql("select hex(value) from properties");
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", false}}), std::nullopt);
    EXPECT_EQ(change({{"_id_", "3"}, {"value", "other"}}), std::nullopt);
    EXPECT_EQ(Property::deletePropertyWithID("3"), std::nullopt);
    EXPECT_EQ(sql("select hex(value) from properties"), stored);
}

TEST_F(PropertyText, ExactRowsThatCannotBeFetchedAreTheListingsFailure) {
    store(1, "x\n   protect = t");
    root.writeTool("/usr/bin/sqlite3",
                   "#!/bin/sh\ncase \"$3\" in *hex*) echo 'Error: busy' >&2; exit 5;; esac\n"
                   "exec /usr/bin/sqlite3 \"$@\"\n");
    std::optional<Error> error;
    EXPECT_FALSE(Property::allPropertiesWithError(error));
    EXPECT_EQ(error, (Error{"sqliteQuery", 5, "Can't execute sqlite3 query: Error: busy\n"}));
}

TEST_F(PropertyText, RowsPrintedBeforeTheToolFailsAreNotListed) {
    root.writeTool("/usr/bin/sqlite3",
                   "#!/bin/sh\nprintf '   id = 1\\nvalue = x\\n\\n   id = 2\\nvalue = y\\n'\n"
                   "sleep 0.1; echo 'Error: busy' >&2; exit 5\n");
    std::optional<Error> error;
    EXPECT_FALSE(Property::allPropertiesWithError(error));
    EXPECT_EQ(error, (Error{"sqliteQuery", 5, "Can't execute sqlite3 query: Error: busy\n"}));
}

TEST_F(PropertyText, RowsReadBeforeTheDoubtfulOneAreListedOnce) {
    store(1, "a");
    store(2, "b");
    store(3, "x\n   protect = t");
    const std::vector<Dictionary> records = listed();
    ASSERT_EQ(records.size(), 3U);
    EXPECT_EQ(records[0].get("value"), Value("a"));
    EXPECT_EQ(records[2].get("value"), Value("x\n   protect = t"));
}

TEST_F(PropertyText, BytesThatAreNotUtf8AreProtectedAsTheyAre) {
    store(1, "caf\xE9\nlatin");
    const adminhost::test::RecordedStatements statements(root);
    EXPECT_EQ(listed()[0].get("value"), Value("caf\xEF\xBF\xBD\nlatin"));
    EXPECT_THAT(statements.take(), ElementsAre(everything, exact));
    EXPECT_EQ(change({{"_id_", "1"}, {"protect", true}}), std::nullopt);
    EXPECT_EQ(row("replace(value,char(10),'')"), protectedByOpenssl("caf\xE9\nlatin"));
}

TEST_F(PropertyText, FurtherColumnsOfTheTableStayInTheRecord) {
    sql("alter table properties add column note");
    store(1, "x\n   timeout = 5");
    store(2, "y");
    sql("update properties set note='kept'");
    const adminhost::test::RecordedStatements statements(root);
    const std::vector<Dictionary> records = listed();
    ASSERT_EQ(records.size(), 2U);
    EXPECT_EQ(records[0].get("value"), Value("x\n   timeout = 5"));
    EXPECT_EQ(records[0].get("note"), Value("kept"));
    EXPECT_EQ(records[0].size(), 8U);
    EXPECT_EQ(records[1].get("note"), Value("kept"));
    EXPECT_THAT(statements.take(), ElementsAre(everything, exact)) << "a column that only the table knows may be text";
}

TEST_F(PropertyText, LineOfTheOnlyValueIsNoFurtherColumn) {
    store(1, "x\n   timeout = 5");
    const std::vector<Dictionary> records = listed();
    ASSERT_EQ(records.size(), 1U);
    EXPECT_EQ(records[0].get("value"), Value("x\n   timeout = 5"));
    EXPECT_FALSE(records[0].contains("timeout"));
}

TEST_F(PropertyText, RandomValuesAreReadBackByteForByte) {
    constexpr int rounds = 20;
    constexpr int rows = 5000;  // 100,000 values in all
    // Harmless pieces make up most rounds, so that both ways of reading are tried.
    const std::vector<std::string> pieces{"\n", "\n", "\n\n", " ", " = ", "=", "word", "two words", "id = 3", "protect",
                                          "value = ", "\t", "\r", "\x1b[0m", "-----BEGIN-----", "\xC3\xA9",
                                          "\xE2\x82\xAC", "'", "\"", "%s", "  id = 4", "name", "created_at = x",
                                          // From here on as the tool prints columns.
                                          "\n        id = 3\n", "\n      name = n\n", "\n     value = v\n",
                                          "\n   protect = f\n", "\nupdated_at = \n", "\xEF\xBF\xBD", "\xE9"};
    constexpr std::size_t harmless = 22;
    std::mt19937 random(20260131);
    for (int round = 0; round < rounds; ++round) {
        const std::size_t kinds = round % 4 == 0 ? pieces.size() : harmless;
        // In some rounds a row spells out another one with a free id. Behind the last row that would be in order.
        const int forged = round % 4 == 1 ? static_cast<int>(random() % (rows - 1)) : -1;
        std::string script = "begin; delete from properties;\n";
        std::vector<std::string> values;
        for (int i = 0; i < rows; ++i) {
            std::string value;
            for (std::size_t n = random() % 9; n > 0; --n) {
                value += pieces[random() % kinds];
            }
            if (i == forged) {
                value = "v\n   protect = f\ncreated_at = \nupdated_at = \n\n        id = " +
                        std::to_string(rows + random() % rows) + "\n      name = n\n     value = w";
            }
            script += "insert into properties values(" + std::to_string(i) + ",'n',cast(x'" + hexOf(value) +
                      "' as text),'f','','');\n";
            values.push_back(std::move(value));
        }
        root.write("/script", script + "commit;\n");
        sql(".read " + root.path("/script").string());
        std::optional<Error> error;
        const auto properties = Property::allPropertiesWithError(error);
        ASSERT_TRUE(properties);
        ASSERT_EQ(properties->size(), values.size()) << "round " << round;
        for (std::size_t i = 0; i < values.size(); ++i) {
            const Dictionary& record = *(*properties)[i]->dictionary();
            ASSERT_EQ(record.get("value"), Value(adminhost::utf8Of(values[i]))) << "round " << round << " row " << i;
            ASSERT_EQ(record.get("id"), Value(std::to_string(i)));
        }
    }
}

}  // namespace
}  // namespace lumio
