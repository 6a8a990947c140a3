#include "settings/EarlyRows.h"

#include "settings/LineRows.h"

#include <algorithm>

namespace lumio {
namespace {

/// Bytes that the tool's text gets in place of those that are not UTF-8. The row is then not the stored one.
constexpr std::string_view replacementCharacter = "\xEF\xBF\xBD";

}  // namespace

void EarlyRows::read(std::string_view output) {
    while (!_doubtful && _read < output.size()) {
        const std::size_t end = output.find('\n', std::max(_read, _searched));
        if (end == std::string_view::npos) {
            _searched = output.size();
            return;
        }
        _doubtful = !readLine(output, output.substr(_read, end - _read));
        _read = end + 1;
    }
}

bool EarlyRows::complete(std::string_view output) {
    read(output);
    return !_doubtful && _read == output.size() && !_begins.empty() && endRow(output, _read) &&
           output.find(replacementCharacter) == std::string_view::npos;
}

bool EarlyRows::readLine(std::string_view output, std::string_view line) {
    if (line.empty()) {
        return endRow(output, _read);
    }
    if (_inFirstRow) {
        return readFirstRowsLine(line);
    }
    const std::size_t next = _begins.size();
    if (next < _prefixes.size() && line.starts_with(_prefixes[next])) {
        _begins.push_back({_read, _read + _prefixes[next].size()});
        return true;
    }
    return next > 0 && !hasSeparatorAt(line, _width);
}

bool EarlyRows::readFirstRowsLine(std::string_view line) {
    if (_begins.empty()) {
        const auto width = widthOfNames(line);
        if (!width) {
            return false;
        }
        _width = *width;
    }
    if (!hasSeparatorAt(line, _width)) {
        return true;
    }
    const std::string_view word = wordOf(line, _width);
    const auto known = std::find(_knownColumns.begin(), _knownColumns.end(), word);
    if (known == _knownColumns.end() || std::find(_columns.begin(), _columns.end(), word) != _columns.end()) {
        return false;
    }
    _columns.emplace_back(word);
    _begins.push_back({_read, _read + _width + columnSeparator.size()});
    return true;
}

bool EarlyRows::endRow(std::string_view output, std::size_t end) {
    if (_inFirstRow) {
        _prefixes = prefixesOf(_columns);
        _inFirstRow = false;
        if (_columns.empty() || _prefixes.front().size() != _width + columnSeparator.size()) {
            return false;
        }
    }
    if (_begins.size() != _columns.size()) {
        return false;
    }
    _values.clear();
    for (std::size_t i = 0; i < _begins.size(); ++i) {
        // Without the line feed before the next column.
        const std::size_t next = i + 1 < _begins.size() ? _begins[i + 1].line : end;
        _values.push_back(output.substr(_begins[i].value, next - 1 - _begins[i].value));
    }
    _begins.clear();
    return _row(_columns, _values);
}

}  // namespace lumio
