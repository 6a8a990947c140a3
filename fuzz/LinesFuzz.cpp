// Output of the database tool: its rows are equal to those of a second, simpler reader. The reader of exact rows has a
// row for each of them, or none, that begins at the same line: an identifier never comes from another row.

#include "settings/LineRows.h"
#include "settings/QueryRunner.h"

#include <cstdint>
#include <cstdlib>
#include <map>
#include <string>
#include <vector>

namespace {

using Row = std::map<std::string, std::string>;

std::vector<std::string> split(const std::string& text, const std::string& separator) {
    std::vector<std::string> pieces;
    std::size_t begin = 0;
    for (std::size_t at = 0; (at = text.find(separator, begin)) != std::string::npos; begin = at + separator.size()) {
        pieces.push_back(text.substr(begin, at - begin));
    }
    pieces.push_back(text.substr(begin));
    return pieces;
}

/// The simpler reader: splits the output into rows and joins their lines.
std::vector<Row> rowsOf(const std::string& output) {
    std::vector<Row> rows;
    const std::vector<std::string> lines = split(output, "\n");
    if (lines.size() == 1) {
        return rows;
    }
    Row pending;
    for (const std::string& line : lines) {
        if (line.empty()) {
            rows.push_back(pending);
            pending.clear();
            continue;
        }
        const std::vector<std::string> pieces = split(line, " = ");
        std::string value = pieces.back();
        if (pieces.size() > 2) {
            value = pieces[1];
            for (std::size_t i = 2; i < pieces.size(); ++i) {
                value += " = " + pieces[i];
            }
        }
        pending[split(pieces.front(), " ").back()] = value;
    }
    return rows;
}

void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    const std::string output(reinterpret_cast<const char*>(data), size);
    const std::vector<adminhost::Dictionary> records = lumio::recordsOfLineOutput(output);
    const std::vector<Row> expected = rowsOf(output);
    require(records.size() == expected.size());
    for (std::size_t i = 0; i < records.size(); ++i) {
        require(records[i].size() == expected[i].size());
        for (const adminhost::DictionaryEntry& entry : records[i]) {
            const auto found = expected[i].find(entry.key);
            require(found != expected[i].end() && entry.value == adminhost::Value(found->second));
        }
    }
    std::vector<std::size_t> begins{0};
    const std::vector<std::string> lines = split(output, "\n");
    for (std::size_t i = 0; i < lines.size(); ++i) {
        if (lines[i].empty()) {
            begins.push_back(i + 1);
        }
    }
    const std::vector<std::string> inferred = lumio::lineColumns(lumio::OutputLines(output));
    for (const std::vector<std::string>& columns : {inferred, std::vector<std::string>{"id", "name", "uuid"}}) {
        const auto rows = lumio::rowsOfRecords(lumio::OutputLines(output), columns);
        require(rows.size() == records.size());
        for (std::size_t i = 0; i < rows.size(); ++i) {
            require(!rows[i] || (rows[i]->line == begins[i] && rows[i]->values.size() == columns.size()));
        }
    }
    return 0;
}
