#include "platform/json/Json.h"
#include "platform/text/Base64Text.h"
#include "platform/text/Hex.h"
#include "platform/text/IsoDate.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstring>
#include <utility>

namespace adminhost {
namespace {

class Writer {
  public:
    explicit Writer(bool pretty) : _pretty(pretty) {}

    void write(const Value& value, std::size_t level);
    [[nodiscard]] std::string take() {
        _text.resize(_size);
        return std::move(_text);
    }

  private:
    /// Room for so many more bytes. A listing has thousands of short texts: one check for each of them is enough.
    char* room(std::size_t more) {
        if (_text.size() - _size < more) {
            _text.resize(std::max(_text.size() * 2, _size + more));
        }
        return _text.data() + _size;
    }
    void put(char c) {
        *room(1) = c;
        ++_size;
    }
    void put(std::string_view bytes) {
        std::copy(bytes.begin(), bytes.end(), room(bytes.size()));
        _size += bytes.size();
    }
    /// A text that needs no escape.
    void putQuoted(std::string_view bytes) {
        char* to = room(bytes.size() + 2);
        *to++ = '"';
        to = std::copy(bytes.begin(), bytes.end(), to);
        *to = '"';
        _size += bytes.size() + 2;
    }
    void putNumber(auto number) {
        char buffer[64];
        put({buffer, std::to_chars(buffer, buffer + sizeof buffer, number).ptr});
    }
    void writeReal(double real);
    void writeString(std::string_view bytes);
    void writeWrapped(std::string_view form, std::string_view text) {
        put("{\"");
        put(form);
        put(_pretty ? "\": \"" : "\":\"");
        put(text);
        put("\"}");
    }
    void newLine(std::size_t level) {
        if (_pretty) {
            put('\n');
            put(std::string(level * 2, ' '));
        }
    }

    bool _pretty;
    std::string _text;  ///< with room at its end
    std::size_t _size = 0;
};

void Writer::writeReal(double real) {
    if (std::isnan(real)) {
        writeWrapped("$real", "nan");
    } else if (std::isinf(real)) {
        writeWrapped("$real", real > 0 ? "infinity" : "-infinity");
    } else {
        const std::size_t start = _size;
        putNumber(real);
        if (std::string_view(_text).substr(start, _size - start).find_first_of(".e") == std::string_view::npos) {
            put(".0");  // else it would be read back as an integer
        }
    }
}

/// ASCII bytes that need no escape. Most texts consist of them.
constexpr std::array<bool, 256> standForThemselves = [] {
    std::array<bool, 256> plain{};
    for (std::size_t byte = 0x20; byte < 0x7f; ++byte) {
        plain[byte] = byte != '"' && byte != '\\';
    }
    return plain;
}();

/// Returns true if all of these bytes stand for themselves.
bool isPlain(std::string_view bytes) noexcept {
    // Eight at a time. A byte that does not stand for itself sets its highest bit in one of the terms.
    constexpr std::uint64_t each = 0x0101010101010101;
    for (std::uint64_t eight = 0; bytes.size() >= sizeof eight; bytes.remove_prefix(sizeof eight)) {
        std::memcpy(&eight, bytes.data(), sizeof eight);
        const auto equals = [&](std::uint64_t byte) { return (eight ^ each * byte) - each; };
        if (((eight | (eight - each * 0x20) | equals('"') | equals('\\') | equals(0x7f)) & each * 0x80) != 0) {
            return false;
        }
    }
    return std::all_of(bytes.begin(), bytes.end(),
                       [](char c) { return standForThemselves[static_cast<unsigned char>(c)]; });
}

void Writer::writeString(std::string_view bytes) {
    if (isPlain(bytes)) {
        putQuoted(bytes);
        return;
    }
    if (!isUtf8(bytes)) {
        writeString(utf8Of(bytes));
        return;
    }
    put('"');
    const auto isPlain = [](char c) {
        return static_cast<unsigned char>(c) >= 0x20 && c != '"' && c != '\\' && c != 0x7f;
    };
    for (auto at = bytes.begin(); at != bytes.end(); ++at) {
        const auto plain = at;
        at = std::find_if_not(plain, bytes.end(), isPlain);
        put({plain, at});
        if (at == bytes.end()) {
            break;
        }
        const char c = *at;
        switch (c) {
            case '"':
            case '\\':
                put('\\');
                put(c);
                break;
            case '\n':
                put("\\n");
                break;
            case '\r':
                put("\\r");
                break;
            case '\t':
                put("\\t");
                break;
            default:
                put("\\u00");
                put(lowerHexDigits[static_cast<std::uint8_t>(c) >> 4U]);
                put(lowerHexDigits[static_cast<std::uint8_t>(c) & 0xFU]);
        }
    }
    put('"');
}

void Writer::write(const Value& value, std::size_t level) {
    switch (value.type()) {
        case Value::Type::null:
            put("null");
            return;
        case Value::Type::boolean:
            put(*value.boolean() ? "true" : "false");
            return;
        case Value::Type::integer:
            if (const auto number = value.integer()) {
                putNumber(*number);
            } else {
                putNumber(*value.unsignedInteger());
            }
            return;
        case Value::Type::real:
            writeReal(*value.real());
            return;
        case Value::Type::string:
            writeString(*value.string());
            return;
        case Value::Type::date:
            writeWrapped("$date", isoTextOf(*value.date()));
            return;
        case Value::Type::data:
            writeWrapped("$data", base64TextOf(*value.data()));
            return;
        case Value::Type::array: {
            std::string_view separator = "[";
            for (const Value& element : *value.array()) {
                put(std::exchange(separator, std::string_view(",")));
                newLine(level + 1);
                write(element, level + 1);
            }
            if (value.array()->empty()) {
                put("[]");
                return;
            }
            newLine(level);
            put(']');
            return;
        }
        case Value::Type::dictionary: {
            std::string_view separator = "{";
            for (const DictionaryEntry& entry : *value.dictionary()) {
                put(std::exchange(separator, std::string_view(",")));
                newLine(level + 1);
                if (entry.key.starts_with('$')) {
                    writeString('$' + entry.key);
                } else {
                    writeString(entry.key);
                }
                put(_pretty ? ": " : ":");
                write(entry.value, level + 1);
            }
            if (value.dictionary()->empty()) {
                put("{}");
                return;
            }
            newLine(level);
            put('}');
            return;
        }
    }
}

}  // namespace

std::string jsonOf(const Value& value, bool pretty) {
    Writer writer(pretty);
    writer.write(value, 0);
    return writer.take();
}

}  // namespace adminhost
