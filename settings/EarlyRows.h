#pragma once

// Reads the rows of the sqlite3 tool's line output while the tool is still writing it.
//
// Reads only outputs without any doubt, which nearly all are: every row has the columns of the first one, each column
// begins on one line, no other line has the columns' separator at their place, and empty lines are only between rows.
// For such an output the rows are those of readLineRows() (LineRows.h). Anything else ends the reading: then the rows
// passed on so far do not count, and the whole output has to be read by the functions of LineRows.h.

#include <cstddef>
#include <functional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace lumio {

class EarlyRows {
  public:
    /// Called for each row with the columns' names and values in their order. The values are parts of the output, valid
    /// during the call. Returns false if the row is in doubt.
    using Row = std::function<bool(std::span<const std::string> columns, std::span<const std::string_view> values)>;

    /// Columns with other names are in doubt.
    EarlyRows(std::span<const std::string> knownColumns, Row row) : _knownColumns(knownColumns), _row(std::move(row)) {}

    /// Reads on. `output` is everything that the tool has written so far.
    void read(std::string_view output);
    /// Reads on to the end. Returns true if the output has rows and is without doubt.
    [[nodiscard]] bool complete(std::string_view output);

  private:
    struct Begin {
        std::size_t line;
        std::size_t value;
    };

    [[nodiscard]] bool readLine(std::string_view output, std::string_view line);
    [[nodiscard]] bool readFirstRowsLine(std::string_view line);
    [[nodiscard]] bool endRow(std::string_view output, std::size_t end);

    std::span<const std::string> _knownColumns;
    Row _row;
    bool _doubtful = false;
    std::size_t _read = 0;      ///< bytes of whole lines that were read
    std::size_t _searched = 0;  ///< bytes in which the end of the next line was not found: a line may have megabytes
    std::size_t _width = 0;     ///< of a column's padded name
    bool _inFirstRow = true;
    std::vector<std::string> _columns;
    std::vector<std::string> _prefixes;  ///< the beginnings of the columns' lines
    std::vector<Begin> _begins;          ///< of the columns of the row that is being read
    std::vector<std::string_view> _values;
};

}  // namespace lumio
