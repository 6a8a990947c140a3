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
    [[nodiscard]] std::string take() { return std::move(_text); }

  private:
    void writeNumber(auto number) {
        char buffer[64];
        _text.append(buffer, std::to_chars(buffer, buffer + sizeof buffer, number).ptr);
    }
    void writeReal(double real);
    void writeString(std::string_view bytes);
    void writeWrapped(std::string_view form, std::string_view text) {
        _text += "{\"";
        _text += form;
        _text += _pretty ? "\": \"" : "\":\"";
        _text += text;
        _text += "\"}";
    }
    void newLine(std::size_t level) {
        if (_pretty) {
            _text += '\n';
            _text.append(level * 2, ' ');
        }
    }

    bool _pretty;
    std::string _text;
};

void Writer::writeReal(double real) {
    if (std::isnan(real)) {
        writeWrapped("$real", "nan");
    } else if (std::isinf(real)) {
        writeWrapped("$real", real > 0 ? "infinity" : "-infinity");
    } else {
        const std::size_t start = _text.size();
        writeNumber(real);
        if (_text.find_first_of(".e", start) == std::string::npos) {
            _text += ".0";  // else it would be read back as an integer
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
        _text += '"';
        _text += bytes;
        _text += '"';
        return;
    }
    if (!isUtf8(bytes)) {
        writeString(utf8Of(bytes));
        return;
    }
    _text += '"';
    const auto isPlain = [](char c) {
        return static_cast<unsigned char>(c) >= 0x20 && c != '"' && c != '\\' && c != 0x7f;
    };
    for (auto at = bytes.begin(); at != bytes.end(); ++at) {
        const auto plain = at;
        at = std::find_if_not(plain, bytes.end(), isPlain);
        _text.append(plain, at);
        if (at == bytes.end()) {
            break;
        }
        const char c = *at;
        switch (c) {
            case '"':
            case '\\':
                _text += '\\';
                _text += c;
                break;
            case '\n':
                _text += "\\n";
                break;
            case '\r':
                _text += "\\r";
                break;
            case '\t':
                _text += "\\t";
                break;
            default:
                _text += "\\u00";
                appendHex(_text, static_cast<std::uint8_t>(c));
        }
    }
    _text += '"';
}

void Writer::write(const Value& value, std::size_t level) {
    switch (value.type()) {
        case Value::Type::null:
            _text += "null";
            return;
        case Value::Type::boolean:
            _text += *value.boolean() ? "true" : "false";
            return;
        case Value::Type::integer:
            if (const auto number = value.integer()) {
                writeNumber(*number);
            } else {
                writeNumber(*value.unsignedInteger());
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
            const char* separator = "[";
            for (const Value& element : *value.array()) {
                _text += std::exchange(separator, ",");
                newLine(level + 1);
                write(element, level + 1);
            }
            if (value.array()->empty()) {
                _text += "[]";
                return;
            }
            newLine(level);
            _text += ']';
            return;
        }
        case Value::Type::dictionary: {
            const char* separator = "{";
            for (const DictionaryEntry& entry : *value.dictionary()) {
                _text += std::exchange(separator, ",");
                newLine(level + 1);
                if (entry.key.starts_with('$')) {
                    writeString('$' + entry.key);
                } else {
                    writeString(entry.key);
                }
                _text += _pretty ? ": " : ":";
                write(entry.value, level + 1);
            }
            if (value.dictionary()->empty()) {
                _text += "{}";
                return;
            }
            newLine(level);
            _text += '}';
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
