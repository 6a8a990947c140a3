#include "platform/value/ValueText.h"

#include "platform/text/Hex.h"

#include <charconv>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <ctime>

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr std::string_view nullText = "(null)";

void appendText(std::string& text, const Value& value, std::size_t indent);

void appendArray(std::string& text, const Array& array, std::size_t indent) {
    text += "(\n";
    for (std::size_t i = 0; i < array.size(); ++i) {
        text.append(indent + 4, ' ');
        appendText(text, array[i], indent + 4);
        text += i + 1 < array.size() ? ",\n" : "\n";
    }
    text.append(indent, ' ');
    text += ')';
}

void appendDictionary(std::string& text, const Dictionary& dictionary, std::size_t indent) {
    text += "{\n";
    for (const DictionaryEntry& entry : dictionary) {
        text.append(indent + 4, ' ');
        text += entry.key;
        text += " = ";
        appendText(text, entry.value, indent + 4);
        text += ";\n";
    }
    text.append(indent, ' ');
    text += '}';
}

void appendText(std::string& text, const Value& value, std::size_t indent) {
    switch (value.type()) {
        case Value::Type::null:
            text += nullText;
            break;
        case Value::Type::boolean:
            text += *value.boolean() ? '1' : '0';
            break;
        case Value::Type::integer:
            if (const auto number = value.integer()) {
                text += fmt::format("{}", *number);
            } else {
                text += fmt::format("{}", *value.unsignedInteger());
            }
            break;
        case Value::Type::real: {
            char buffer[512];  // the longest texts, of the smallest numbers, have about 330 characters
            const auto end = std::to_chars(buffer, buffer + sizeof buffer, *value.real(), std::chars_format::fixed).ptr;
            text.append(buffer, end);
            break;
        }
        case Value::Type::string:
            text += *value.string();
            break;
        case Value::Type::date: {
            const std::time_t seconds = value.date()->time_since_epoch().count();
            std::tm parts{};
            ::gmtime_r(&seconds, &parts);
            char buffer[64];
            text.append(buffer, std::strftime(buffer, sizeof buffer, "%Y-%m-%d %H:%M:%S +0000", &parts));
            break;
        }
        case Value::Type::data:
            text += '<' + hexOf(*value.data()) + '>';
            break;
        case Value::Type::array:
            appendArray(text, *value.array(), indent);
            break;
        case Value::Type::dictionary:
            appendDictionary(text, *value.dictionary(), indent);
            break;
    }
}

bool isBlank(char c) noexcept {
    return c == ' ' || c == '\t';
}

bool truthOf(const Value& value, bool skipZeros) noexcept {
    if (const auto boolean = value.boolean()) {
        return *boolean;
    }
    if (value.isInteger()) {
        return value.integer() != 0;
    }
    if (const auto real = value.real()) {
        return *real != 0;
    }
    const std::string* text = value.string();
    if (text == nullptr) {
        return false;
    }
    std::size_t at = 0;
    while (at < text->size() && isBlank((*text)[at])) {
        ++at;
    }
    while (skipZeros && at < text->size() && (*text)[at] == '0') {
        ++at;
    }
    return at < text->size() && std::strchr("YyTt123456789", (*text)[at]) != nullptr && (*text)[at] != '\0';
}

}  // namespace

std::string textOf(const Value& value) {
    std::string text;
    appendText(text, value, 0);
    return text;
}

std::string textOf(const std::optional<std::string>& text) {
    return text ? *text : std::string(nullText);
}

std::string textOf(const Error& error) {
    std::string text = fmt::format("{} ({})", error.domain, error.code);
    if (error.description) {
        text += ": " + *error.description;
    }
    return text;
}

std::string textOf(const std::optional<Error>& error) {
    return error ? textOf(*error) : std::string(nullText);
}

bool booleanOf(const Value& value) noexcept {
    return truthOf(value, false);
}
bool flagOf(const Value& value) noexcept {
    return truthOf(value, true);
}

}  // namespace adminhost
