#include "settings/LineRows.h"

#include <algorithm>
#include <iterator>
#include <unordered_map>
#include <unordered_set>

namespace lumio {
namespace {

constexpr std::size_t minimumWidth = 5;

std::optional<std::size_t> widthOf(const OutputLines& lines) noexcept {
    return lines.count() == 0 ? std::nullopt : widthOfNames(lines[0]);
}

/// The words of a row's lines, each once.
std::vector<std::string> wordsOf(const OutputLines& lines, const LineRow& row, std::optional<std::size_t> width) {
    std::vector<std::string> words;
    std::unordered_set<std::string_view> seen;
    std::size_t next = 0;
    for (std::size_t i = row.line; width && i < row.end; ++i) {
        const std::string_view word = wordOf(lines[i], *width);
        // Nearly every row repeats the words of the one before it in their order.
        if (next == words.size()) {
            next = 0;
        }
        if (next < words.size() && word == words[next]) {
            ++next;
        } else if (!word.empty() && seen.insert(word).second) {
            words.emplace_back(word);
            next = words.size();
        }
    }
    return words;
}

/// Returns true if a row's lines have all the words in this order. A row for which this is false may have them all the
/// same.
bool hasInOrder(const OutputLines& lines, const LineRow& row, std::optional<std::size_t> width,
                const std::vector<std::string>& words) {
    auto wanted = words.begin();
    for (std::size_t i = row.line; width && i < row.end && wanted != words.end(); ++i) {
        if (wordOf(lines[i], *width) == *wanted) {
            ++wanted;
        }
    }
    return wanted == words.end();
}

/// Divides the lines [begin, end) of one row among the columns; empty unless there is exactly one way.
std::vector<std::string_view> valuesOf(const OutputLines& lines, std::size_t begin, std::size_t end,
                                       const std::vector<std::string>& prefixes) {
    const std::size_t skip = prefixes.front().size();
    std::vector<std::string_view> values;
    values.reserve(prefixes.size());
    // Nearly every row has one line for each column: then there is no other way to divide them.
    if (end - begin == prefixes.size()) {
        for (std::size_t i = 0; i < prefixes.size(); ++i) {
            const std::string_view line = lines[begin + i];
            if (!line.starts_with(prefixes[i])) {
                return {};
            }
            values.push_back(line.substr(skip));
        }
        return values;
    }
    std::vector<std::size_t> starts;
    starts.reserve(prefixes.size() + 1);
    // ways[j]: in how many ways the lines so far can end within column j; 2 means more than one.
    std::vector<unsigned> ways(prefixes.size(), 0);
    struct Candidate {
        std::size_t line;
        std::size_t column;
    };
    std::vector<Candidate> candidates;
    for (std::size_t i = begin; i < end; ++i) {
        const auto found = std::find_if(prefixes.begin(), prefixes.end(),
                                        [&](const std::string& prefix) { return lines[i].starts_with(prefix); });
        const auto column = static_cast<std::size_t>(found - prefixes.begin());
        if (i == begin) {
            if (column != 0) {
                return {};
            }
            ways[0] = 1;
            candidates.push_back({i, 0});
        } else if (found != prefixes.end() && column != 0 && ways[column - 1] != 0) {
            ways[column] = std::min(2U, ways[column] + ways[column - 1]);
            candidates.push_back({i, column});
        }
    }
    if (ways.back() != 1) {
        return {};
    }
    // The one way, from its end: each column begins at its last candidate before the next column's.
    std::size_t wanted = prefixes.size();
    for (auto candidate = candidates.rbegin(); candidate != candidates.rend(); ++candidate) {
        if (candidate->column + 1 == wanted) {
            starts.push_back(candidate->line);
            --wanted;
        }
    }
    std::reverse(starts.begin(), starts.end());
    starts.push_back(end);
    for (std::size_t j = 0; j < prefixes.size(); ++j) {
        values.push_back(lines.text(starts[j], starts[j + 1], skip));
    }
    return values;
}

std::vector<LineRow> rowsOf(const OutputLines& lines, std::span<const std::string> columns) {
    std::vector<LineRow> rows;
    if (columns.empty() || lines.count() == 0) {
        return rows;
    }
    const std::vector<std::string> prefixes = prefixesOf(columns);
    std::vector<std::size_t> begins{0};
    for (std::size_t i = 2; i < lines.count(); ++i) {
        if (lines[i - 1].empty() && lines[i].starts_with(prefixes.front())) {
            begins.push_back(i);
        }
    }
    rows.reserve(begins.size());
    for (std::size_t i = 0; i < begins.size(); ++i) {
        const bool isLast = i + 1 == begins.size();
        if (isLast && lines.isCut()) {
            break;
        }
        const std::size_t end = isLast ? lines.count() : begins[i + 1] - 1;
        rows.push_back({begins[i], end, valuesOf(lines, begins[i], end, prefixes)});
    }
    return rows;
}

}  // namespace

std::vector<std::string> prefixesOf(std::span<const std::string> columns) {
    std::size_t width = minimumWidth;
    for (const std::string& column : columns) {
        width = std::max(width, column.size());
    }
    std::vector<std::string> prefixes;
    prefixes.reserve(columns.size());
    for (const std::string& column : columns) {
        prefixes.push_back(std::string(width - column.size(), ' ') + column + std::string(columnSeparator));
    }
    return prefixes;
}

std::optional<std::size_t> widthOfNames(std::string_view firstLine) noexcept {
    const std::size_t width = firstLine.find(columnSeparator, minimumWidth);
    return width == std::string_view::npos ? std::nullopt : std::optional(width);
}

std::string_view wordOf(std::string_view line, std::size_t width) noexcept {
    if (!hasSeparatorAt(line, width)) {
        return {};
    }
    std::string_view word = line.substr(0, width);
    word.remove_prefix(std::min(word.find_first_not_of(' '), word.size()));
    return word.find(' ') == std::string_view::npos ? word : std::string_view();
}

OutputLines::OutputLines(std::string_view output) : _output(output) {
    _begins.push_back(0);
    for (std::size_t at = output.find('\n'); at != std::string_view::npos; at = output.find('\n', at + 1)) {
        _begins.push_back(at + 1);
    }
}

std::vector<LineRow> readLineRows(const OutputLines& lines, std::span<const std::string> columns) {
    return rowsOf(lines, columns);
}

std::vector<std::string> lineColumns(const OutputLines& lines) {
    const LineRow all{0, lines.count(), {}};
    return wordsOf(lines, all, widthOf(lines));
}

std::vector<std::string> lineColumnsOfEvery(const OutputLines& lines, std::span<const LineRow> rows) {
    const std::optional<std::size_t> width = widthOf(lines);
    std::vector<std::string> common;
    for (std::size_t i = 0; i < rows.size() && (i == 0 || !common.empty()); ++i) {
        if (i > 0 && hasInOrder(lines, rows[i], width, common)) {
            continue;
        }
        std::vector<std::string> words = wordsOf(lines, rows[i], width);
        if (i == 0) {
            common = std::move(words);
            continue;
        }
        const std::unordered_set<std::string> known(std::make_move_iterator(words.begin()),
                                                    std::make_move_iterator(words.end()));
        std::erase_if(common, [&](const std::string& word) { return !known.contains(word); });
    }
    return common;
}

std::vector<std::optional<LineRow>> rowsOfRecords(const OutputLines& lines, std::span<const std::string> columns) {
    std::vector<LineRow> rows = rowsOf(lines, columns);
    std::unordered_map<std::string_view, int> seen;
    for (const LineRow& row : rows) {
        if (!row.values.empty()) {
            ++seen[row.values.front()];
        }
    }
    std::vector<std::optional<LineRow>> found;
    auto row = rows.begin();
    bool begins = true;
    for (std::size_t i = 0; i < lines.count(); ++i) {
        if (begins) {
            found.emplace_back();
            for (; row != rows.end() && row->line < i; ++row) {
            }
            if (row != rows.end() && row->line == i && !row->values.empty() && seen[row->values.front()] == 1) {
                found.back() = std::move(*row);
            }
        }
        begins = lines[i].empty();
    }
    // A last empty line closes a record and opens another one, which the end of the output closes. Text behind the last
    // line feed leaves the last record open, and an open record is not among them.
    if (lines.count() != 0 && begins != lines.isCut()) {
        if (begins) {
            found.emplace_back();
        } else {
            found.pop_back();
        }
    }
    return found;
}

}  // namespace lumio
