#pragma once

// Rows read from the raw text of the sqlite3 tool's line output, by the names of the columns.
//
// The tool prints each column's name on the left, padded to the longest one (at least five characters), then " = " and
// the value, whose line feeds come as they are. A line therefore begins a column only if it is exactly the padded name
// of the next column; anything else belongs to the value before it. A row begins at the first line, and at the padded
// name of the first column behind an empty line.
//
// A value may hold lines that look exactly like a column. A row whose lines can be divided among the columns in more
// than one way, or in none, is returned without values: its content is not known. A value that spells out the rest of
// its row and whole rows after it cannot be told from those rows by their text.

#include <cstddef>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace lumio {

// The form of a line that begins a column.

constexpr std::string_view columnSeparator = " = ";  ///< between a column's padded name and its value

/// The beginnings of the columns' lines, with their separator.
[[nodiscard]] std::vector<std::string> prefixesOf(std::span<const std::string> columns);
/// The length of the padded names, from the first line of an output; nullopt if the line does not begin a column.
[[nodiscard]] std::optional<std::size_t> widthOfNames(std::string_view firstLine) noexcept;
[[nodiscard]] inline bool hasSeparatorAt(std::string_view line, std::size_t width) noexcept {
    return line.size() >= width + columnSeparator.size() &&
           line.substr(width, columnSeparator.size()) == columnSeparator;
}
/// The word of a line "   word = ..." whose separator begins at the width; empty if the line has another form.
[[nodiscard]] std::string_view wordOf(std::string_view line, std::size_t width) noexcept;

/// The whole lines of an output, found once for all readers of it. Refers to the output, which must outlive it.
class OutputLines {
  public:
    explicit OutputLines(std::string_view output);

    [[nodiscard]] std::size_t count() const noexcept { return _begins.size() - 1; }
    /// Returns true if there is text after the last line feed.
    [[nodiscard]] bool isCut() const noexcept { return _begins.back() != _output.size(); }
    [[nodiscard]] std::string_view operator[](std::size_t i) const noexcept {
        return _output.substr(_begins[i], _begins[i + 1] - 1 - _begins[i]);
    }
    /// The lines [begin, end) as one text, without the first `skip` bytes and the last line feed.
    [[nodiscard]] std::string_view text(std::size_t begin, std::size_t end, std::size_t skip) const noexcept {
        return _output.substr(_begins[begin] + skip, _begins[end] - 1 - _begins[begin] - skip);
    }

  private:
    std::string_view _output;
    std::vector<std::size_t> _begins;  ///< of each line, and the end of the last one
};

struct LineRow {
    std::size_t line = 0;                  ///< index of the row's first line in the output
    std::size_t end = 0;                   ///< index of the line after its last one
    std::vector<std::string_view> values;  ///< in the columns' order, part of the output; empty if not known

    friend bool operator==(const LineRow&, const LineRow&) = default;
};

/// The rows of an output whose columns have these names, in this order. An output that does not end in a line feed was
/// cut off; its last row is left out.
[[nodiscard]] std::vector<LineRow> readLineRows(const OutputLines& lines, std::span<const std::string> columns);

/// The names on all lines that look like columns, each once, in the order of their first lines. Lines of values may be
/// among them.
[[nodiscard]] std::vector<std::string> lineColumns(const OutputLines& lines);

/// Those of them that every one of the rows has.
[[nodiscard]] std::vector<std::string> lineColumnsOfEvery(const OutputLines& lines, std::span<const LineRow> rows);

/// For each record that recordsOfLineOutput reads, the row that begins at the same line and is known; none for a record
/// that is only a piece of a row, and for rows whose first column occurs twice.
[[nodiscard]] std::vector<std::optional<LineRow>> rowsOfRecords(const OutputLines& lines,
                                                                std::span<const std::string> columns);

}  // namespace lumio
