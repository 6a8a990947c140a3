#include "platform/bundle/StringsTable.h"

#include "platform/plist/PropertyList.h"
#include "platform/text/Hex.h"
#include "platform/text/LineAndColumn.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <cstring>
#include <optional>
#include <string>

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr std::string_view byteOrderMark = "\xEF\xBB\xBF";

auto failed(std::string description) {
    return failure(Error{"stringsTable", 1, std::move(description)});
}

bool isHighSurrogate(char32_t unit) noexcept {
    return unit >= 0xD800 && unit < 0xDC00;
}
bool isLowSurrogate(char32_t unit) noexcept {
    return unit >= 0xDC00 && unit < 0xE000;
}
char32_t joined(char32_t high, char32_t low) noexcept {
    return 0x10000 + ((high - 0xD800) << 10U) + (low - 0xDC00);
}

/// Returns nullopt if it is not well-formed.
std::optional<std::string> textOfUtf16(std::string_view bytes, bool bigEndian) {
    FromUtf16 converted = utf8OfUtf16(bytes, bigEndian);
    return converted.end == bytes.size() ? std::optional(std::move(converted.text)) : std::nullopt;
}

/// The table's text in UTF-8 without a byte-order mark. Returns nullopt if it is in none of the encodings read.
std::optional<std::string> textOfTable(std::string_view bytes) {
    if (bytes.starts_with("\xFE\xFF") || bytes.starts_with("\xFF\xFE")) {
        return textOfUtf16(bytes.substr(2), bytes[0] == '\xFE');
    }
    // A table begins with an ASCII character. Without a byte-order mark, that character gives the byte order.
    if (bytes.size() >= 2 && (bytes[0] == '\0') != (bytes[1] == '\0')) {
        return textOfUtf16(bytes, bytes[0] == '\0');
    }
    if (bytes.starts_with(byteOrderMark)) {
        bytes.remove_prefix(byteOrderMark.size());
    }
    return isUtf8(bytes) ? std::optional<std::string>(bytes) : std::nullopt;
}

bool isBlank(char c) noexcept {
    return c == ' ' || (c >= '\t' && c <= '\r');
}
bool isOctal(char c) noexcept {
    return c >= '0' && c <= '7';
}
bool isUnquoted(char c) noexcept {
    return (c >= '0' && c <= '9') || (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') ||
           (c != '\0' && std::strchr("_$/:.-", c) != nullptr);
}

class StringsTableParser {
  public:
    explicit StringsTableParser(std::string_view text) : _text(text) {}

    std::optional<Dictionary> table() {
        Dictionary entries;
        if (!skip()) {
            return std::nullopt;
        }
        const bool braced = take('{');
        if (!readEntries(entries, braced) || !skip()) {
            return std::nullopt;
        }
        if (!atEnd()) {
            fail("a key is expected here");
            return std::nullopt;
        }
        return entries;
    }

    [[nodiscard]] std::string problem() const {
        return fmt::format("{}: {}", lineAndColumnAfter(_text.substr(0, _at)), _problem);
    }

  private:
    [[nodiscard]] bool atEnd() const noexcept { return _at == _text.size(); }
    [[nodiscard]] bool startsWith(std::string_view what) const noexcept { return _text.substr(_at).starts_with(what); }

    bool take(char c) noexcept {
        if (atEnd() || _text[_at] != c) {
            return false;
        }
        ++_at;
        return true;
    }

    bool fail(const char* problem) noexcept {
        _problem = problem;
        return false;
    }

    /// Blanks and comments.
    bool skip() {
        for (;;) {
            while (!atEnd() && isBlank(_text[_at])) {
                ++_at;
            }
            if (startsWith("//")) {
                _at = std::min(_text.find_first_of("\n\r", _at), _text.size());
            } else if (startsWith("/*")) {
                const std::size_t end = _text.find("*/", _at + 2);
                if (end == std::string_view::npos) {
                    return fail("this comment has no end");
                }
                _at = end + 2;
            } else {
                return true;
            }
        }
    }

    bool readEntries(Dictionary& entries, bool braced) {
        for (;;) {
            if (!skip()) {
                return false;
            }
            if (braced && take('}')) {
                return true;
            }
            if (atEnd()) {
                return !braced || fail("a key or \"}\" is expected here");
            }
            std::string key;
            if (!readText(key, "a key is expected here") || !skip()) {
                return false;
            }
            Value value(key);
            if (take('=') && (!skip() || !readValue(value) || !skip())) {
                return false;
            }
            if (!take(';')) {
                return fail("\";\" is expected here");
            }
            entries.set(key, std::move(value));
        }
    }

    bool readValue(Value& value) {
        if (_depth == stringsTableMaximumDepth) {
            return fail("lists and dictionaries are nested too deep here");
        }
        ++_depth;
        bool good = false;
        if (take('{')) {
            Dictionary dictionary;
            good = readEntries(dictionary, true);
            value = std::move(dictionary);
        } else if (take('(')) {
            Array array;
            good = readArray(array);
            value = std::move(array);
        } else if (take('<')) {
            Data data;
            good = readData(data);
            value = std::move(data);
        } else {
            std::string text;
            good = readText(text, "a value is expected here");
            value = std::move(text);
        }
        --_depth;
        return good;
    }

    bool readArray(Array& array) {
        for (;;) {
            if (!skip()) {
                return false;
            }
            if (take(')')) {
                return true;
            }
            Value value;
            if (!readValue(value) || !skip()) {
                return false;
            }
            array.push_back(std::move(value));
            if (!take(',') && (atEnd() || _text[_at] != ')')) {
                return fail("\",\" or \")\" is expected here");
            }
        }
    }

    bool readData(Data& data) {
        int high = -1;
        for (; !atEnd(); ++_at) {
            const int digit = hexValueOf(_text[_at]);
            if (digit >= 0) {
                if (high >= 0) {
                    data.push_back(static_cast<std::uint8_t>(high * 16 + digit));
                }
                high = high >= 0 ? -1 : digit;
            } else if (!isBlank(_text[_at])) {
                break;
            }
        }
        return (high < 0 && take('>')) || fail("hexadecimal digits in pairs and \">\" are expected here");
    }

    bool readText(std::string& text, const char* expected) {
        if (take('"')) {
            return readQuoted(text, '"');
        }
        if (take('\'')) {
            return readQuoted(text, '\'');
        }
        const std::size_t start = _at;
        while (!atEnd() && isUnquoted(_text[_at]) && !startsWith("//") && !startsWith("/*")) {
            ++_at;
        }
        text = _text.substr(start, _at - start);
        return !text.empty() || fail(expected);
    }

    bool readQuoted(std::string& text, char quote) {
        const std::size_t start = _at - 1;
        while (!atEnd()) {
            const char c = _text[_at];
            if (c == '\0') {
                return fail("a text cannot hold the character NUL");
            }
            if (c == '\\') {
                if (!readEscape(text)) {
                    return false;
                }
                continue;
            }
            ++_at;
            if (c == quote) {
                return true;
            }
            text += c;
        }
        _at = start;
        return fail("this text has no closing quote");
    }

    bool readEscape(std::string& text) {
        const std::size_t start = _at++;
        if (atEnd()) {
            return fail("this text has no closing quote");
        }
        const char c = _text[_at];
        char32_t character = 0;
        if (isOctal(c)) {
            const std::size_t end = std::min(_at + 3, _text.size());
            for (; _at < end && isOctal(_text[_at]); ++_at) {
                character = character * 8 + static_cast<char32_t>(_text[_at] - '0');
            }
            if (character > 0xFF) {
                _at = start;
                return fail("an octal escape ends at \\377");
            }
        } else if (c == 'U' || c == 'u') {
            if (!readUnicodeEscape(character)) {
                _at = start;
                return fail("an escape of four hexadecimal digits that name a character is expected here");
            }
        } else {
            constexpr std::string_view letters = "abfnrtv";
            constexpr std::string_view meanings = "\a\b\f\n\r\t\v";
            const std::size_t letter = letters.find(c);
            // Any other character is copied as it is; its further bytes are copied by the next turns.
            text += letter == std::string_view::npos ? c : meanings[letter];
            ++_at;
            return c != '\0' || fail("a text cannot hold the character NUL");
        }
        if (character == 0) {
            _at = start;
            return fail("a text cannot hold the character NUL");
        }
        appendUtf8(text, character);
        return true;
    }

    /// From the letter on; a pair of escapes for a character beyond U+FFFF.
    bool readUnicodeEscape(char32_t& character) {
        if (!readUnit(character) || isLowSurrogate(character)) {
            return false;
        }
        if (isHighSurrogate(character)) {
            char32_t low = 0;
            if (!take('\\') || (!startsWith("U") && !startsWith("u")) || !readUnit(low) || !isLowSurrogate(low)) {
                return false;
            }
            character = joined(character, low);
        }
        return true;
    }

    bool readUnit(char32_t& unit) {
        ++_at;
        unit = 0;
        for (int i = 0; i < 4; ++i, ++_at) {
            const int digit = atEnd() ? -1 : hexValueOf(_text[_at]);
            if (digit < 0) {
                return false;
            }
            unit = unit * 16 + static_cast<char32_t>(digit);
        }
        return true;
    }

    std::string_view _text;
    std::size_t _at = 0;
    int _depth = 0;
    const char* _problem = "";
};

Result<Dictionary> parseAsPropertyList(std::string_view bytes) {
    Result<Value> value = parsePropertyList(bytes);
    if (!value) {
        return failure(std::move(value.error()));
    }
    if (value->dictionary() == nullptr) {
        return failed(
            fmt::format("a strings table is a dictionary, this property list is a {}", nameOf(value->type())));
    }
    return std::move(*value->dictionary());
}

}  // namespace

Result<Dictionary> parseStringsTable(std::string_view bytes) {
    if (bytes.size() > stringsTableMaximumSize) {
        return failed(fmt::format("a strings table of more than {} bytes is not read", stringsTableMaximumSize));
    }
    if (bytes.starts_with("bplist")) {
        return parseAsPropertyList(bytes);
    }
    const std::optional<std::string> text = textOfTable(bytes);
    if (!text) {
        return failed("a strings table is in UTF-8 or UTF-16, this one is in neither");
    }
    const auto first = std::find_if_not(text->begin(), text->end(), isBlank);
    if (first != text->end() && *first == '<') {
        return parseAsPropertyList(bytes);
    }
    StringsTableParser parser(*text);
    std::optional<Dictionary> table = parser.table();
    if (!table) {
        return failed(parser.problem());
    }
    return std::move(*table);
}

}  // namespace adminhost
