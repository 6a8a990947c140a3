#pragma once

// A table for reading, fitted to a width.

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

/// Headings in capitals, two blanks between columns, numbers aligned to the right. If the table is too wide, its widest
/// columns are narrowed and their texts wrapped, between words if possible. If that is not enough, the last columns are
/// omitted and named below the table, with the rows that have texts in these columns only.
class Table {
  public:
    explicit Table(std::vector<std::string> headings);

    /// The column with this number is the last one to be omitted.
    void keep(std::size_t column) { _kept = column; }

    /// One cell for each heading; texts as shown() returns them.
    void addRow(std::vector<std::string> cells);
    /// Every line begins with `indent` blanks and ends in a line feed. Columns that are empty in all rows are omitted.
    [[nodiscard]] std::string text(std::size_t width, std::size_t indent) const;

  private:
    struct Column {
        std::size_t at;
        std::size_t width;
        std::size_t word;  ///< width of the longest text without blanks
        bool number;
    };
    [[nodiscard]] std::vector<Column> columns() const;
    [[nodiscard]] static bool narrow(std::vector<Column>& columns, std::size_t width, std::size_t indent);
    void appendRow(std::string& text, const std::vector<std::string>& cells, const std::vector<Column>& columns,
                   std::size_t indent) const;

    std::vector<std::string> _headings;
    std::size_t _kept = 0;
    std::vector<std::vector<std::string>> _rows;
};

}  // namespace adminhost::ctl
