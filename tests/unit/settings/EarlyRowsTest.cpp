#include "settings/EarlyRows.h"
#include "settings/LineRows.h"

#include <random>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace lumio {
namespace {

using testing::ElementsAre;
using testing::IsEmpty;

using Row = std::vector<std::string>;

const std::vector<std::string> known{"id", "value", "protect"};

/// Reads an output that arrives in pieces of this many bytes.
struct Reading {
    explicit Reading(const std::string& output, std::size_t piece = 7)
        : rows(known, [this](std::span<const std::string> columns, std::span<const std::string_view> values) {
              names.assign(columns.begin(), columns.end());
              read.emplace_back(values.begin(), values.end());
              return read.back().front() != "refused";
          }) {
        for (std::size_t end = piece; end < output.size(); end += piece) {
            rows.read(std::string_view(output).substr(0, end));
        }
        certain = rows.complete(output);
    }

    EarlyRows rows;
    std::vector<std::string> names;
    std::vector<Row> read;
    bool certain = false;
};

TEST(EarlyRows, RowsOfAPlainOutputAreRead) {
    for (const std::size_t piece : {1U, 7U, 1000U}) {
        const Reading reading("     id = 1\n  value = a\nprotect = t\n\n     id = 2\n  value = \nprotect = f\n", piece);
        EXPECT_TRUE(reading.certain);
        EXPECT_THAT(reading.names, ElementsAre("id", "value", "protect"));
        EXPECT_THAT(reading.read, ElementsAre(ElementsAre("1", "a", "t"), ElementsAre("2", "", "f")));
    }
}

TEST(EarlyRows, EachRowIsPassedOnAtItsEnd) {
    std::vector<Row> read;
    EarlyRows rows(known, [&](std::span<const std::string>, std::span<const std::string_view> values) {
        read.emplace_back(values.begin(), values.end());
        return true;
    });
    const std::string output = "   id = 1\nvalue = a\n\n   id = 2\nvalue = b\n";
    const std::size_t second = output.find("   id = 2");
    rows.read(std::string_view(output).substr(0, second - 1));
    EXPECT_THAT(read, IsEmpty());
    rows.read(std::string_view(output).substr(0, second));
    EXPECT_THAT(read, ElementsAre(ElementsAre("1", "a")));
}

TEST(EarlyRows, FurtherLinesOfAValueBelongToIt) {
    const Reading reading(
        "     id = 1\n  value = a\nb\n id = 2\nprotect = t\n\n     id = 2\n  value = c\nd\nprotect = f\n");
    EXPECT_TRUE(reading.certain);
    EXPECT_THAT(reading.read, ElementsAre(ElementsAre("1", "a\nb\n id = 2", "t"), ElementsAre("2", "c\nd", "f")));
}

TEST(EarlyRows, AnythingElseIsInDoubt) {
    for (const char* output : {
             "",
             "\n",
             "no separator\n",
             "     id = 1\n  value = a\nprotect = t",
             "     id = 1\n  value = a\nprotect = t\n\n",
             "     id = 1\n  value = a\nprotect = t\n\n\n",
             "     id = 1\n  value = a\n\nprotect = t\n",
             "     id = 1\n  value = a\nprotect = t\n\nb\n",
             "     id = 1\n  value = a\nprotect = t\nprotect = f\n",
             "     id = 1\n  value = a\nprotect = t\n\n     id = 2\nprotect = f\n",
             "     id = 1\n  value = a\nprotect = t\n\n     id = 2\nprotect = a\n  value = f\n",
             "     id = 1\n  value = a\nprotect = t\n\n     id = 2\n  value = a\n  value = b\nprotect = f\n",
             "     id = 1\n  value = a\nprotect = t\n\n     id = 2\n  value = a\n  other = b\nprotect = f\n",
             "     id = 1\n  value = a\nprotect = t\n  other = b\n",
             "     id = 1\n  value = a\nwo rd x = b\nprotect = t\n",
             "        id = 1\n     value = a\n   protect = t\n",
             "     id = 1\n  value = \xEF\xBF\xBD\nprotect = t\n",
             "     id = refused\n  value = a\nprotect = t\n",
         }) {
        EXPECT_FALSE(Reading(output).certain) << output;
    }
}

/// An output of lines that occur in real ones and in forged ones.
std::string anyOutput(std::mt19937& random) {
    constexpr const char* lines[] = {"     id = 1", "  value = a", "protect = t", "",        "more",
                                     "  other = x", "  value = ",  "     id = 2", "protect", " = "};
    constexpr const char* row = "     id = 3\n  value = b\nprotect = f\n";
    std::string output;
    for (unsigned i = random() % 4; i > 0; --i) {
        output += std::string(row) + "\n";
    }
    if (random() % 2 != 0) {
        output += row;
    }
    for (unsigned i = random() % 6; i > 0; --i) {
        output += lines[random() % std::size(lines)];
        output += '\n';
    }
    return output;
}

TEST(EarlyRows, WithoutDoubtTheRowsAreThoseOfTheWholeReading) {
    std::mt19937 random(1);
    int certain = 0;
    for (int i = 0; i < 20'000; ++i) {
        const std::string output = anyOutput(random);
        const Reading early(output, 1 + random() % 20);
        if (!early.certain) {
            continue;
        }
        ++certain;
        SCOPED_TRACE(output);
        const OutputLines lines(output);
        ASSERT_EQ(lineColumns(lines), early.names);
        const std::vector<LineRow> rows = readLineRows(lines, early.names);
        ASSERT_EQ(lineColumnsOfEvery(lines, rows), early.names);
        ASSERT_EQ(rows.size(), early.read.size());
        for (std::size_t row = 0; row < rows.size(); ++row) {
            ASSERT_EQ(Row(rows[row].values.begin(), rows[row].values.end()), early.read[row]);
        }
    }
    EXPECT_GT(certain, 1000);
}

}  // namespace
}  // namespace lumio
