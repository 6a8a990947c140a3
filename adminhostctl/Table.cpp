#include "adminhostctl/Table.h"

#include "adminhostctl/Width.h"

#include <algorithm>
#include <cctype>
#include <numeric>
#include <utility>

namespace adminhost::ctl {
namespace {

constexpr std::size_t gap = 2;
constexpr std::size_t leastWidth = 12;  ///< columns are not made narrower than this

std::string capitals(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(),
                   [](unsigned char c) { return c == '_' ? ' ' : static_cast<char>(std::toupper(c)); });
    return text;
}

/// Digits, with a sign and one decimal point at most; thousands may be separated.
bool isNumber(std::string_view text) {
    return !text.empty() && text.find_first_not_of("0123456789.,-") == std::string_view::npos &&
           text.find('.') == text.rfind('.') && text.rfind('-') + 1 <= 1;
}

std::size_t lengthOfLongestWord(std::string_view text) {
    std::size_t longest = 0;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find_first_of(" \n"), text.size());
        longest = std::max(longest, widthOf(text.substr(0, end)));
        text.remove_prefix(std::min(end + 1, text.size()));
    }
    return longest;
}

}  // namespace

Table::Table(std::vector<std::string> headings) : _headings(std::move(headings)) {
    for (std::string& heading : _headings) {
        heading = capitals(std::move(heading));
    }
}

void Table::addRow(std::vector<std::string> cells) {
    cells.resize(_headings.size());
    _rows.push_back(std::move(cells));
}

/// Narrows the widest columns until all fit; returns true if they do.
bool Table::narrow(std::vector<Column>& columns, std::size_t width, std::size_t indent) {
    const std::size_t gaps = columns.empty() ? 0 : gap * (columns.size() - 1);
    std::size_t total = std::accumulate(columns.begin(), columns.end(), indent + gaps,
                                        [](std::size_t sum, const Column& column) { return sum + column.width; });
    for (const bool withinWords : {false, true}) {
        const auto room = [&](const Column& column) {
            const std::size_t least = withinWords ? leastWidth : std::max(leastWidth, column.word);
            return column.width > least ? column.width : 0;
        };
        while (total > width) {
            const auto widest = std::max_element(columns.begin(), columns.end(),
                                                 [&](const Column& a, const Column& b) { return room(a) < room(b); });
            if (widest == columns.end() || room(*widest) == 0) {
                break;
            }
            --widest->width;
            --total;
        }
    }
    return total <= width;
}

std::vector<Table::Column> Table::columns() const {
    std::vector<Column> columns;
    for (std::size_t at = 0; at < _headings.size(); ++at) {
        Column column{at, widthOf(_headings[at]), lengthOfLongestWord(_headings[at]), true};
        bool empty = true;
        for (const auto& row : _rows) {
            empty = empty && row[at].empty();
            column.number = column.number && (row[at].empty() || isNumber(row[at]));
            column.word = std::max(column.word, lengthOfLongestWord(row[at]));
            for (const std::string& line : wrapped(row[at], SIZE_MAX)) {
                column.width = std::max(column.width, widthOf(line));
            }
        }
        if (!empty) {
            columns.push_back(column);
        }
    }
    return columns;
}

void Table::appendRow(std::string& text, const std::vector<std::string>& cells, const std::vector<Column>& columns,
                      std::size_t indent) const {
    std::vector<std::vector<std::string>> lines;
    std::size_t height = 1;
    for (const Column& column : columns) {
        lines.push_back(wrapped(cells[column.at], column.width));
        height = std::max(height, lines.back().size());
    }
    for (std::size_t i = 0; i < height; ++i) {
        std::string line(indent, ' ');
        for (std::size_t c = 0; c < columns.size(); ++c) {
            const std::string cell = i < lines[c].size() ? lines[c][i] : std::string();
            const std::size_t used = widthOf(cell);
            const std::string fill(columns[c].width > used ? columns[c].width - used : 0, ' ');
            line += columns[c].number ? fill + cell : cell + fill;
            line.append(gap, ' ');
        }
        line.erase(line.find_last_not_of(' ') + 1);
        text += line + '\n';
    }
}

std::string Table::text(std::size_t width, std::size_t indent) const {
    const std::vector<Column> natural = columns();
    std::vector<Column> columns = natural;
    std::vector<Column> left = natural;
    std::string leftOut;
    while (!narrow(columns, width, indent) && columns.size() > 1) {
        const auto last = left.end() - (left.back().at == _kept ? 2 : 1);
        leftOut.insert(0, _headings[last->at] + (leftOut.empty() ? "" : ", "));
        left.erase(last);
        columns = left;
    }
    std::string text;
    appendRow(text, _headings, columns, indent);
    for (const auto& row : _rows) {
        if (leftOut.empty() || std::any_of(columns.begin(), columns.end(),
                                           [&](const Column& column) { return !row[column.at].empty(); })) {
            appendRow(text, row, columns, indent);
        }
    }
    if (!leftOut.empty()) {
        for (const std::string& line :
             wrapped("(omitted columns: " + leftOut + ")", std::max(width, indent + 2) - indent)) {
            text.append(indent, ' ').append(line).append("\n");
        }
    }
    return text;
}

}  // namespace adminhost::ctl
