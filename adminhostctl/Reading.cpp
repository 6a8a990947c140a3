#include "adminhostctl/Reading.h"

#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <ctime>
#include <optional>
#include <string_view>
#include <vector>

#include <fmt/format.h>

namespace adminhost::ctl {
namespace {

bool isTable(const Value& value) {
    const Array* array = value.array();
    return array != nullptr && !array->empty() &&
           std::all_of(array->begin(), array->end(), [](const Value& v) { return v.dictionary() != nullptr; });
}

/// The value as a number, also if the number is stored as text.
std::optional<double> numberOf(const Value& value) {
    if (const auto real = value.real()) {
        return real;
    }
    const std::string digits = value.isInteger() ? textOf(value) : value.string() != nullptr ? *value.string() : "";
    double number = 0;
    const char* const end = digits.data() + digits.size();
    const auto result = std::from_chars(digits.data(), end, number);
    return result.ec == std::errc() && result.ptr == end ? std::optional(number) : std::nullopt;
}

}  // namespace

std::string textWithUnit(const Value& value, const std::string& unit) {
    // A number with a unit of settings is shown as it is stored: that is the number to be written.
    const std::string_view word = wordOfUnit(unit);
    if (!word.empty()) {
        return numberOf(value) ? shown(textOf(value)) + ' ' + std::string(word) : "";
    }
    const auto number = numberOf(value);
    if (unit == "bytes" && number && *number >= 0 && *number < 18e18) {
        return sizeText(static_cast<std::uint64_t>(*number));
    }
    return {};
}

std::string_view wordOfUnit(std::string_view unit) {
    return unit == "seconds" ? "s" : unit == "minutes" ? "min" : unit == "megabytes" ? "MB" : "";
}

std::string sizeText(std::uint64_t bytes) {
    constexpr std::array<const char*, 7> units = {"bytes", "kB", "MB", "GB", "TB", "PB", "EB"};
    if (bytes < 1000) {
        return fmt::format("{} {}", bytes, bytes == 1 ? "byte" : "bytes");
    }
    double size = static_cast<double>(bytes);
    std::size_t unit = 0;
    // A number that would be rounded to 1000 is shown as 1 of the next unit.
    while (size >= 999.5 && unit + 1 < units.size()) {
        size /= 1000;
        ++unit;
    }
    return fmt::format("{:.{}f} {}", size, size < 99.95 ? 1 : 0, units.at(unit));
}

std::string dateText(Date date) {
    const std::time_t seconds = date.time_since_epoch().count();
    std::tm parts{};
    if (::localtime_r(&seconds, &parts) == nullptr) {
        return textOf(Value(date));
    }
    constexpr std::array<const char*, 12> months = {"Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                                    "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};
    return fmt::format("{} {} {}, {:02}:{:02}", parts.tm_mday, months.at(static_cast<std::size_t>(parts.tm_mon)),
                       parts.tm_year + 1900L, parts.tm_hour, parts.tm_min);
}

std::string personText(const DescribedKey& element, const Dictionary& entry) {
    const std::string_view kind = entry.text(element.kind);
    if (kind.empty()) {
        return {};
    }
    for (const std::string& key : element.title) {
        if (const std::string_view text = entry.text(key); !text.empty()) {
            return shown(text) + " (" + shown(kind) + ")";
        }
    }
    return {};
}

std::string Reading::personAt(const Dictionary& entry, const std::string& path) const {
    const DescribedKey* element = _description.answerKey(path);
    return element != nullptr && !element->title.empty() ? personText(*element, entry) : std::string();
}

bool Reading::isPeople(const Value& value, const std::string& path) const {
    return isTable(value) && std::all_of(value.array()->begin(), value.array()->end(), [&](const Value& element) {
               return !personAt(*element.dictionary(), path + "[]").empty();
           });
}

/// Whether the value gets lines of its own below its key.
bool Reading::isSection(const Value& value, const std::string& path) const {
    return (value.dictionary() != nullptr && !value.dictionary()->empty()) ||
           (isTable(value) && !isPeople(value, path));
}

std::string Reading::cell(const Value& value, const std::string& path) const {
    if (const DescribedKey* key = _description.answerKey(path); key != nullptr && !key->unit.empty()) {
        std::string text = textWithUnit(value, key->unit);
        if (!text.empty()) {
            return text;
        }
    }
    if (const auto boolean = value.boolean()) {
        return *boolean ? "yes" : "no";
    }
    if (const auto date = value.date()) {
        return dateText(*date);
    }
    if (const Data* data = value.data()) {
        return sizeText(data->size()) + " of data";
    }
    if (const Array* array = value.array()) {
        std::string text;
        for (const Value& element : *array) {
            const Dictionary* entry = element.dictionary();
            std::string one = entry != nullptr ? personAt(*entry, path + "[]") : std::string();
            text += (text.empty() ? "" : ", ") + (one.empty() ? cell(element, path + "[]") : one);
        }
        return text.empty() ? "none" : text;
    }
    if (const Dictionary* dictionary = value.dictionary()) {
        std::string text;
        for (const DictionaryEntry& entry : *dictionary) {
            text += (text.empty() ? "" : ", ") + shown(entry.key) + ": " + cell(entry.value, path + '.' + entry.key);
        }
        return text.empty() ? "none" : text;
    }
    return shown(textOf(value));
}

void Reading::appendTable(std::string& text, const Array& rows, const std::string& path, std::size_t indent) const {
    std::vector<std::string> keys;
    std::vector<std::string> headings;
    const std::string element = path + "[].";
    for (const std::string& key : indent == 0 ? _columns : std::vector<std::string>()) {
        const DescribedKey* described = _description.answerKey(element + key);
        keys.push_back(key);
        headings.push_back(described == nullptr || described->column.empty() ? shown(key) : described->column);
    }
    const bool isChosen = !keys.empty();
    for (const DescribedKey& key : _description.answerKeys()) {
        if (!isChosen && !key.column.empty() && key.path.starts_with(element) &&
            key.path.find('.', element.size()) == std::string::npos) {
            keys.push_back(key.path.substr(element.size()));
            headings.push_back(key.column);
        }
    }
    if (keys.empty()) {  // the description names no columns
        for (const Value& row : rows) {
            for (const DictionaryEntry& entry : *row.dictionary()) {
                if (std::find(keys.begin(), keys.end(), entry.key) == keys.end()) {
                    keys.push_back(entry.key);
                }
            }
        }
        for (const std::string& key : keys) {
            headings.push_back(shown(key));
        }
    }
    Table table(std::move(headings));
    // In a narrow terminal the list of people is omitted last: it is why most such tables are shown.
    for (std::size_t i = 0; i < keys.size(); ++i) {
        if (const DescribedKey* key = _description.answerKey(element + keys[i]);
            key != nullptr && key->unit == "people") {
            table.keep(i);
        }
    }
    for (const Value& row : rows) {
        std::vector<std::string> cells;
        for (const std::string& key : keys) {
            const Value* value = row.dictionary()->find(key);
            cells.push_back(value != nullptr ? cell(*value, element + key) : std::string());
        }
        table.addRow(std::move(cells));
    }
    text += table.text(_width, indent);
}

void Reading::appendDictionary(std::string& text, const Dictionary& dictionary, const std::string& path,
                               std::size_t indent) const {
    const auto below = [&](const DictionaryEntry& entry) { return path.empty() ? entry.key : path + '.' + entry.key; };
    std::size_t longest = 0;
    for (const DictionaryEntry& entry : dictionary) {
        longest = isSection(entry.value, below(entry)) ? longest : std::max(longest, widthOf(shown(entry.key)));
    }
    const std::size_t column = indent + longest + 2;
    // Single values first: between tables they would be lost.
    for (const DictionaryEntry& entry : dictionary) {
        if (isSection(entry.value, below(entry))) {
            continue;
        }
        text += beside(std::string(indent, ' ') + shown(entry.key), cell(entry.value, below(entry)),
                       {column, indent + 4, _width});
    }
    bool empty = text.empty();
    for (const DictionaryEntry& entry : dictionary) {
        if (!isSection(entry.value, below(entry))) {
            continue;
        }
        text += empty ? "" : "\n";
        empty = false;
        text.append(indent, ' ').append(shown(entry.key));
        if (const Dictionary* inner = entry.value.dictionary()) {
            text += '\n';
            appendDictionary(text, *inner, below(entry), indent + 2);
        } else {
            text += " (" + std::to_string(entry.value.array()->size()) + ")\n";
            appendTable(text, *entry.value.array(), below(entry), indent + 2);
        }
    }
}

std::string Reading::text(const Value& value, const std::string& path) const {
    std::string text;
    if (value.dictionary() != nullptr && !value.dictionary()->empty()) {
        appendDictionary(text, *value.dictionary(), path, 0);
    } else if (isTable(value) && !isPeople(value, path)) {
        appendTable(text, *value.array(), path, 0);
    } else {
        for (const std::string& line : wrapped(cell(value, path), _width)) {
            text += line + '\n';
        }
    }
    return text;
}

}  // namespace adminhost::ctl
