#include "resources/PropertyRows.h"

#include "platform/text/Hex.h"
#include "platform/value/ValueText.h"
#include "resources/Property.h"
#include "settings/EarlyRows.h"
#include "settings/LineRows.h"
#include "settings/QueryRunner.h"

#include <algorithm>
#include <charconv>
#include <cstdint>
#include <optional>
#include <span>
#include <utility>

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

/// The order of the ids. The table is listed in ascending order; a row that a value spells out has this only if its
/// number is free and fits there.
class AscendingIds {
  public:
    explicit AscendingIds(std::span<const std::string> columns)
        : _column(static_cast<std::size_t>(std::find(columns.begin(), columns.end(), "id") - columns.begin())) {}

    /// Returns true if the row's id is a number greater than the last one, or if the rows have no id.
    [[nodiscard]] bool accept(std::span<const std::string_view> values) {
        if (_column >= values.size()) {
            return true;
        }
        const std::string_view text = values[_column];
        std::uint64_t number = 0;
        const auto [end, failure] = std::from_chars(text.data(), text.data() + text.size(), number);
        const bool fits = failure == std::errc() && end == text.data() + text.size() && (_isFirst || number > _last);
        _last = number;
        _isFirst = false;
        return fits;
    }

  private:
    std::size_t _column;
    bool _isFirst = true;
    std::uint64_t _last = 0;
};

bool idsAscend(const Reading& reading) {
    AscendingIds ids(reading.columns);
    return std::all_of(reading.rows.begin(), reading.rows.end(),
                       [&](const LineRow& row) { return ids.accept(row.values); });
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

Dictionary rowOf(std::span<const std::string> columns, std::span<const std::string_view> values) {
    Dictionary row;
    for (std::size_t i = 0; i < columns.size(); ++i) {
        row.append(columns[i], values[i]);
    }
    return row;
}

std::optional<std::string> bytesOfHex(std::string_view digits) {
    auto bytes = adminhost::textOfHex(digits);
    if (bytes) {
        // The tool's ordinary output ends a text there too.
        bytes->resize(std::min(bytes->find('\0'), bytes->size()));
    }
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

Result<void> readPropertyRows(const std::string& columns, const std::string& rest, RowCount count,
                              const PropertyRowReceiver& receiver) {
    std::optional<AscendingIds> ids;
    std::size_t added = 0;
    EarlyRows early(Property::tableColumnNames(),
                    [&](std::span<const std::string> names, std::span<const std::string_view> values) {
                        if (!ids) {
                            ids.emplace(names);
                        }
                        if ((count == RowCount::atMostOne && added > 0) || !ids->accept(values)) {
                            return false;
                        }
                        receiver.add(rowOf(names, values));
                        ++added;
                        return true;
                    });
    const auto output = statementOutput("select " + columns + rest, [&](std::string_view soFar) { early.read(soFar); });
    if (output && early.complete(*output)) {
        return {};
    }
    if (added > 0) {
        receiver.discard();
    }
    if (!output) {
        return adminhost::failure(output.error());
    }
    if (output->find('\n') == std::string::npos) {
        return {};
    }
    const Reading reading = readingOf(*output);
    const bool tooMany = count == RowCount::atMostOne && reading.rows.size() > 1;
    if (tooMany || !isCertain(reading, *output)) {
        auto rows = exactRows(reading, *output, rest);
        if (!rows) {
            return adminhost::failure(std::move(rows.error()));
        }
        for (Dictionary& row : *rows) {
            receiver.add(std::move(row));
        }
        return {};
    }
    for (const LineRow& read : reading.rows) {
        receiver.add(rowOf(reading.columns, read.values));
    }
    return {};
}

Result<std::vector<Dictionary>> propertyRows(const std::string& columns, const std::string& rest, RowCount count) {
    std::vector<Dictionary> rows;
    return readPropertyRows(columns, rest, count,
                            {[&](Dictionary row) { rows.push_back(std::move(row)); }, [&] { rows.clear(); }})
        .map([&] { return std::move(rows); });
}

}  // namespace lumio
