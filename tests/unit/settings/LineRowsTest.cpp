#include "settings/LineRows.h"
#include "settings/QueryRunner.h"

#include <random>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

const std::vector<std::string> columns{"id", "value", "protect"};

/// The values of all rows; "?" for a row that is not known.
std::vector<std::vector<std::string>> read(std::string_view output, const std::vector<std::string>& names = columns) {
    std::vector<std::vector<std::string>> rows;
    for (const LineRow& row : readLineRows(OutputLines(output), names)) {
        rows.emplace_back(row.values.begin(), row.values.end());
        if (row.values.empty()) {
            rows.back().emplace_back("?");
        }
    }
    return rows;
}

TEST(LineRows, EachColumnBeginsWithItsPaddedName) {
    EXPECT_THAT(read("     id = 1\n  value = a\nprotect = t\n\n     id = 2\n  value = \nprotect = f\n"),
                ElementsAre(ElementsAre("1", "a", "t"), ElementsAre("2", "", "f")));
    EXPECT_THAT(read("   id = 1\n", {"id"}), ElementsAre(ElementsAre("1"))) << "at least five characters";
    EXPECT_THAT(read("id = 1\n", {"id"}), ElementsAre(ElementsAre("?")));
    EXPECT_THAT(read(""), IsEmpty());
}

TEST(LineRows, OtherLinesBelongToTheValueBeforeThem) {
    EXPECT_THAT(read("     id = 1\n  value = a\nid = 2\n\n protect = x\n\nprotect = t\n"),
                ElementsAre(ElementsAre("1", "a\nid = 2\n\n protect = x\n", "t")));
    EXPECT_THAT(read("     id = 1\n  value = a\nprotect = t\n\n\n     id = 2\n  value = b\nprotect = f\n"),
                ElementsAre(ElementsAre("1", "a", "t\n"), ElementsAre("2", "b", "f")));
}

TEST(LineRows, LineOfAColumnThatIsNotTheNextOneBelongsToTheValue) {
    EXPECT_THAT(read("     id = 1\nprotect = a\n     id = 2\n  value = b\nprotect = t\n"),
                ElementsAre(ElementsAre("1\nprotect = a\n     id = 2", "b", "t")));
}

TEST(LineRows, RowThatCanBeDividedInSeveralWaysOrInNoneIsNotKnown) {
    EXPECT_THAT(read("     id = 1\n  value = a\nprotect = t\nprotect = f\n"), ElementsAre(ElementsAre("?")));
    EXPECT_THAT(read("     id = 1\n  value = a\n\n     id = 2\n  value = b\nprotect = f\n"),
                ElementsAre(ElementsAre("?"), ElementsAre("2", "b", "f")));
    EXPECT_THAT(read("     id = 1\nprotect = t\n"), ElementsAre(ElementsAre("?")));
}

TEST(LineRows, CutOutputLosesItsLastRow) {
    EXPECT_THAT(read("     id = 1\n  value = a\nprotect = t\n\n     id = 2\n  value = b\nprotect = f"),
                ElementsAre(ElementsAre("1", "a", "t")));
}

TEST(LineRows, NamesOfColumnsAreThoseOnLinesWithTheSameSeparator) {
    const std::string output =
        "     id = 1\n  value = a\n   word = b\nother word = c\n x = d\nprotect = t\n\n     id = 2\n"
        "  value = a\nprotect = t\n";
    EXPECT_THAT(lineColumns(OutputLines(output)), ElementsAre("id", "value", "word", "protect"));
    const std::vector<LineRow> rows = readLineRows(OutputLines(output), columns);
    EXPECT_THAT(lineColumnsOfEvery(OutputLines(output), rows), ElementsAre("id", "value", "protect"));
    EXPECT_THAT(lineColumns(OutputLines("")), IsEmpty());
    EXPECT_THAT(lineColumns(OutputLines("no separator\n")), IsEmpty());
}

TEST(LineRows, RowsOfRecordsMatchTheRecordsOfTheLineReading) {
    const std::string output =
        "     id = 1\n  value = a\n\nb\nprotect = t\n\n     id = 2\n  value = c\nprotect = t\n\n     id = 3\n  value = "
        "d\n"
        "protect = t\n\n";
    const auto rows = rowsOfRecords(OutputLines(output), columns);
    ASSERT_EQ(rows.size(), recordsOfLineOutput(output).size());
    ASSERT_EQ(rows.size(), 5U);
    EXPECT_EQ(rows[0]->values[1], "a\n\nb");
    EXPECT_EQ(rows[1], std::nullopt) << "a piece of the first row";
    EXPECT_EQ(rows[2]->values[0], "2");
    EXPECT_EQ(rows[3]->values[2], "t\n");
    EXPECT_EQ(rows[4], std::nullopt);
    EXPECT_EQ(
        rowsOfRecords(OutputLines("     id = 1\n  value = a\nprotect = t\n\n     id = 1\n  value = b\nprotect = t\n"),
                      columns),
        std::vector<std::optional<LineRow>>(2))
        << "an id that comes twice belongs to neither";
}

TEST(LineRows, EveryOutputHasARowForEachRecordThatBeginsAtTheSameLine) {
    const std::vector<std::string> pieces{
        "\n",       "\n\n", "     id = 1\n", "     id = 2\n", "  value = a\n", "protect = t\n",
        "id = 3\n", "text", " = ",           "     id = 4"};
    std::mt19937 random(20260131);
    for (int round = 0; round < 20'000; ++round) {
        std::string output;
        for (std::size_t n = random() % 14; n > 0; --n) {
            output += pieces[random() % pieces.size()];
        }
        SCOPED_TRACE(output);
        std::vector<std::size_t> begins{0};
        std::size_t line = 0;
        for (std::size_t at = 0, end = 0; (end = output.find('\n', at)) != std::string::npos; at = end + 1, ++line) {
            if (at == end) {
                begins.push_back(line + 1);
            }
        }
        const auto rows = rowsOfRecords(OutputLines(output), columns);
        ASSERT_EQ(rows.size(), recordsOfLineOutput(output).size());
        for (std::size_t i = 0; i < rows.size(); ++i) {
            ASSERT_TRUE(!rows[i] || rows[i]->line == begins[i]) << i;
        }
    }
}

}  // namespace
}  // namespace lumio
