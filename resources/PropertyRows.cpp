#include "resources/PropertyRows.h"

#include "platform/text/Hex.h"
#include "platform/value/ValueText.h"
#include "resources/Property.h"
#include "settings/LineRows.h"
#include "settings/QueryRunner.h"

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <optional>

namespace lumio {

using adminhost::Dictionary;
using adminhost::Error;
using adminhost::Result;

namespace {

constexpr std::string_view replacementCharacter = "\xEF\xBF\xBD";

using Names = std::vector<std::string>;

bool isColumn(const std::string& name) {
    const Names& columns = Property::tableColumnNames();
    return std::find(columns.begin(), columns.end(), name) != columns.end();
}

/// A reading of an output, with the facts known about its columns.
struct Reading {
    Names columns;  ///< those of the properties table
    std::vector<LineRow> rows;
    Names further;  ///< other names for which every row has a line
};

Reading readingOf(const std::string& output) {
    const OutputLines lines(output);
    Reading reading{lineColumns(lines), {}, {}};
    std::erase_if(reading.columns, [](const std::string& name) { return !isColumn(name); });
    reading.rows = readLineRows(lines, reading.columns);
    reading.further = lineColumnsOfEvery(lines, reading.rows);
    std::erase_if(reading.further, isColumn);
    return reading;
}

/// Returns true if the ids are numbers and each is greater than the one before: the table is listed in this order. A
/// row that a value spells out has this only if its number is free and fits there.
bool idsAscend(const Reading& reading) {
    const auto found = std::find(reading.columns.begin(), reading.columns.end(), "id");
    if (found == reading.columns.end()) {
        return true;
    }
    const auto id = static_cast<std::size_t>(found - reading.columns.begin());
    std::optional<std::uint64_t> last;
    return std::all_of(reading.rows.begin(), reading.rows.end(), [&](const LineRow& row) {
        const std::string_view text = row.values[id];
        std::uint64_t number = 0;
        const auto [end, failure] = std::from_chars(text.data(), text.data() + text.size(), number);
        const bool fits = failure == std::errc() && end == text.data() + text.size() && (!last || number > *last);
        last = number;
        return fits;
    });
}

/// Returns true if the output can be read in one way only.
bool isCertain(const Reading& reading, const std::string& output) {
    // A name for which every row has a line may be a further column of the table.
    return reading.further.empty() && output.ends_with('\n') &&
           output.find(replacementCharacter) == std::string::npos && !reading.rows.empty() &&
           std::none_of(reading.rows.begin(), reading.rows.end(),
                        [](const LineRow& row) { return row.values.empty(); }) &&
           idsAscend(reading);
}

std::optional<std::string> bytesOfHex(std::string_view digits) {
    if (digits.size() % 2 != 0 || digits.find_first_not_of("0123456789ABCDEF") != std::string_view::npos) {
        return std::nullopt;
    }
    std::string bytes;
    bytes.reserve(digits.size() / 2);
    for (std::size_t i = 0; i < digits.size(); i += 2) {
        bytes += static_cast<char>(adminhost::hexValueOf(digits[i]) * 16 + adminhost::hexValueOf(digits[i + 1]));
    }
    // The tool's ordinary output ends a text there too.
    bytes.resize(std::min(bytes.find('\0'), bytes.size()));
    return bytes;
}

/// Adds the columns that the table has besides its own ones, as the ordinary output shows them. A line that is part of
/// the value is not a column.
void addFurtherColumns(std::vector<Dictionary>& rows, const Reading& reading, const std::string& output) {
    const OutputLines all(output);
    Names shown = lineColumns(all);
    std::erase_if(shown, [&](const std::string& name) {
        return !isColumn(name) &&
               std::find(reading.further.begin(), reading.further.end(), name) == reading.further.end();
    });
    const std::vector<LineRow> read = readLineRows(all, shown);
    if (reading.further.empty() || read.size() != rows.size()) {
        return;
    }
    for (std::size_t column = 0; column < shown.size(); ++column) {
        const std::string& name = shown[column];
        for (std::size_t i = 0; i < rows.size() && !isColumn(name); ++i) {
            const std::string lines = '\n' + adminhost::textOf(rows[i].get("value"));
            if (!read[i].values.empty() && lines.find(' ' + name + " = ") == std::string::npos &&
                lines.find('\n' + name + " = ") == std::string::npos) {
                rows[i].set(name, read[i].values[column]);
            }
        }
    }
}

Result<std::vector<Dictionary>> exactRows(const Reading& reading, const std::string& output, const std::string& rest) {
    const Names& columns = reading.columns;
    Names selected;
    std::string list;
    for (const std::string& column : columns) {
        selected.push_back("hex(" + column + ")");
        list += (list.empty() ? "" : ",") + selected.back();
    }
    const auto digits = statementOutput("select " + list + rest);
    if (!digits) {
        return adminhost::failure(digits.error());
    }
    std::vector<Dictionary> rows;
    for (const LineRow& read : readLineRows(OutputLines(*digits), selected)) {
        Dictionary& row = rows.emplace_back();
        for (std::size_t i = 0; i < columns.size(); ++i) {
            std::optional<std::string> text = read.values.empty() ? std::nullopt : bytesOfHex(read.values[i]);
            if (!text) {
                return adminhost::failure(
                    Error{"sqliteQuery", 1, "Can't execute sqlite3 query: Error: the tool's output cannot be read"});
            }
            row.set(columns[i], *std::move(text));
        }
    }
    addFurtherColumns(rows, reading, output);
    return rows;
}

}  // namespace

Result<std::vector<Dictionary>> propertyRows(const std::string& columns, const std::string& rest, RowCount count) {
    const auto output = statementOutput("select " + columns + rest);
    if (!output) {
        return adminhost::failure(output.error());
    }
    std::vector<Dictionary> rows;
    if (output->find('\n') == std::string::npos) {
        return rows;
    }
    const Reading reading = readingOf(*output);
    const bool tooMany = count == RowCount::atMostOne && reading.rows.size() > 1;
    if (tooMany || !isCertain(reading, *output)) {
        return exactRows(reading, *output, rest);
    }
    rows.reserve(reading.rows.size());
    for (const LineRow& read : reading.rows) {
        Dictionary& row = rows.emplace_back();
        for (std::size_t i = 0; i < reading.columns.size(); ++i) {
            row.append(reading.columns[i], read.values[i]);
        }
    }
    return rows;
}

}  // namespace lumio
