#include "resources/WrappedRows.h"

#include "resources/Property.h"

#include <algorithm>
#include <string>

namespace lumio {

using adminhost::Dictionary;
using adminhost::DictionaryEntry;

namespace {

bool isColumn(std::string_view key) {
    const std::vector<std::string>& columns = Property::tableColumnNames();
    return std::find(columns.begin(), columns.end(), key) != columns.end();
}

/// A line without separator was read as its own value, under its last word.
bool isPiece(const std::string& key, const std::string& line) {
    return line == key || line.ends_with(" " + key);
}

bool hasColumnsOnly(const Dictionary& record) {
    const std::vector<std::string>& columns = Property::tableColumnNames();
    // Nearly every record is a whole row, with its columns in the table's order.
    const auto sameKey = [](const DictionaryEntry& entry, const std::string& column) { return entry.key == column; };
    return std::equal(record.begin(), record.end(), columns.begin(), columns.end(), sameKey) ||
           std::all_of(record.begin(), record.end(), [](const DictionaryEntry& entry) { return isColumn(entry.key); });
}

/// One row being put together from its records.
class Row {
  public:
    void add(const Dictionary& record) {
        for (const DictionaryEntry& entry : record) {
            const std::string* line = entry.value.string();
            if (isColumn(entry.key)) {
                closeValue();
                _inValue = entry.key == "value" && line != nullptr;
                _value = _inValue ? *line : "";
                _row.set(entry.key, entry.value);
            } else if (_inValue && line != nullptr && isPiece(entry.key, *line)) {
                _value += '\n';
                _value += *line;
            } else {
                _row.set(entry.key, entry.value);
                if (_inValue) {
                    _strays.push_back(entry.key);
                }
            }
        }
    }

    /// The empty line that closed the record was the value's own.
    void addEmptyLine() {
        if (_inValue) {
            _value += '\n';
        }
    }

    Dictionary finish() {
        closeValue();
        if (_row.get("protect") == adminhost::Value("t")) {
            for (const std::string& stray : _strays) {
                _row.remove(stray);
            }
        }
        return std::move(_row);
    }

  private:
    void closeValue() {
        if (_inValue) {
            _row.set("value", std::move(_value));
            _inValue = false;
        }
    }

    Dictionary _row;
    std::string _value;
    std::vector<std::string> _strays;
    bool _inValue = false;
};

}  // namespace

std::vector<Dictionary> wholePropertyRows(std::vector<Dictionary> records) {
    if (records.empty() || records.front().empty()) {
        return records;
    }
    std::vector<Dictionary> rows;
    const std::string firstColumn = records.front().begin()->key;
    const auto beginsRow = [&](std::size_t i) {
        return i == records.size() || (!records[i].empty() && records[i].begin()->key == firstColumn);
    };
    rows.reserve(records.size());
    for (std::size_t i = 0; i < records.size();) {
        if (beginsRow(i + 1) && hasColumnsOnly(records[i])) {
            rows.push_back(std::move(records[i++]));
            continue;
        }
        Row row;
        row.add(records[i]);
        for (++i; !beginsRow(i); ++i) {
            // A piece at the beginning of the record goes on with the text behind the empty line.
            row.addEmptyLine();
            row.add(records[i]);
        }
        rows.push_back(row.finish());
    }
    return rows;
}

}  // namespace lumio
