#include "platform/plist/PropertyList.h"
#include "platform/plist/Readers.h"
#include "platform/text/Base64Text.h"
#include "platform/text/IsoDate.h"
#include "platform/text/Utf8.h"

#include <charconv>
#include <cmath>

#include <fmt/format.h>

namespace adminhost {
namespace {

class XmlWriter {
  public:
    /// Returns false, with what() and where(), if a value cannot be carried.
    bool write(const Value& value) {
        _text = "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<plist version=\"1.0\">\n";
        const bool done = append(value, 0);
        _text += "</plist>\n";
        return done;
    }
    [[nodiscard]] std::string& text() noexcept { return _text; }
    [[nodiscard]] const std::string& what() const noexcept { return _what; }
    /// The key path of the value that cannot be carried, empty for the whole list.
    [[nodiscard]] const std::string& where() const noexcept { return _where; }

  private:
    bool refuse(std::string_view what) {
        _what = what;
        return false;
    }

    bool append(const Value& value, int depth) {
        if ((value.array() != nullptr || value.dictionary() != nullptr) && depth == plistMaximumDepth) {
            return refuse(fmt::format("nested more than {} deep", plistMaximumDepth));
        }
        indent(depth);
        switch (value.type()) {
            case Value::Type::null:
                return refuse("null cannot be written");
            case Value::Type::boolean:
                _text += *value.boolean() ? "<true/>\n" : "<false/>\n";
                return true;
            case Value::Type::integer:
                appendInteger(value);
                return true;
            case Value::Type::real:
                appendReal(*value.real());
                return true;
            case Value::Type::string:
                return appendText("string", *value.string());
            case Value::Type::date:
                return appendDate(*value.date());
            case Value::Type::data:
                _text += "<data>" + base64TextOf(*value.data()) + "</data>\n";
                return true;
            case Value::Type::array:
                return appendArray(*value.array(), depth);
            case Value::Type::dictionary:
                return appendDictionary(*value.dictionary(), depth);
        }
        return refuse("a value of no known type");
    }

    void appendInteger(const Value& value) {
        if (const auto number = value.integer()) {
            _text += fmt::format("<integer>{}</integer>\n", *number);
        } else {
            _text += fmt::format("<integer>{}</integer>\n", *value.unsignedInteger());
        }
    }

    void appendReal(double number) {
        char buffer[64];
        // Shortest form that reads back as the same number; the sign of a not-a-number means nothing.
        const auto end = std::to_chars(buffer, buffer + sizeof buffer, std::isnan(number) ? NAN : number).ptr;
        _text += "<real>";
        _text.append(buffer, end);
        _text += "</real>\n";
    }

    bool appendDate(Date date) {
        if (!hasFourDigitYear(date)) {
            return refuse("a date outside the years 0000 to 9999 cannot be written");
        }
        _text += "<date>" + isoTextOf(date) + "</date>\n";
        return true;
    }

    bool appendArray(const Array& array, int depth) {
        if (array.empty()) {
            _text += "<array/>\n";
            return true;
        }
        _text += "<array>\n";
        for (std::size_t i = 0; i < array.size(); ++i) {
            if (!append(array[i], depth + 1)) {
                prefixPlace(fmt::format("{}", i));
                return false;
            }
        }
        indent(depth);
        _text += "</array>\n";
        return true;
    }

    bool appendDictionary(const Dictionary& dictionary, int depth) {
        if (dictionary.empty()) {
            _text += "<dict/>\n";
            return true;
        }
        _text += "<dict>\n";
        for (const DictionaryEntry& entry : dictionary) {
            indent(depth + 1);
            if (!appendText("key", entry.key) || !append(entry.value, depth + 1)) {
                prefixPlace(utf8Of(entry.key));
                return false;
            }
        }
        indent(depth);
        _text += "</dict>\n";
        return true;
    }

    bool appendText(std::string_view element, std::string_view text) {
        _text += '<';
        _text += element;
        _text += '>';
        if (!appendEscaped(text)) {
            return false;
        }
        _text += "</";
        _text += element;
        _text += ">\n";
        return true;
    }

    bool appendEscaped(std::string_view text) {
        if (!isUtf8(text)) {
            return refuse("text that is not UTF-8 cannot be written");
        }
        std::size_t begin = 0;  // of what is not yet copied
        for (std::size_t i = 0; i < text.size(); ++i) {
            const auto byte = static_cast<unsigned char>(text[i]);
            const std::string_view escape = escapeOf(byte);
            if (!escape.empty()) {
                _text.append(text.substr(begin, i - begin)).append(escape);
                begin = i + 1;
            } else if ((byte < 0x20 && byte != '\t' && byte != '\n') ||
                       (byte == 0xEF && (text.substr(i, 3) == "\xEF\xBF\xBE" || text.substr(i, 3) == "\xEF\xBF\xBF"))) {
                return refuse(fmt::format("text with the character U+{:04X} cannot be written",
                                          byte < 0x20 ? byte : (text[i + 2] == '\xBE' ? 0xFFFE : 0xFFFF)));
            }
        }
        _text.append(text.substr(begin));
        return true;
    }

    static std::string_view escapeOf(unsigned char byte) noexcept {
        switch (byte) {
            case '&':
                return "&amp;";
            case '<':
                return "&lt;";
            case '>':
                return "&gt;";
            case '\r':
                return "&#13;";  // a bare one would be read back as a line feed
            default:
                return {};
        }
    }

    void indent(int depth) { _text.append(static_cast<std::size_t>(depth), '\t'); }

    void prefixPlace(std::string_view component) {
        _where = _where.empty() ? std::string(component) : fmt::format("{}.{}", component, _where);
    }

    std::string _text;
    std::string _what;
    std::string _where;
};

}  // namespace

Result<std::string> xmlPropertyList(const Value& value) {
    XmlWriter writer;
    std::string what;
    if (!writer.write(value)) {
        what = writer.where().empty() ? writer.what() : fmt::format("{}: {}", writer.where(), writer.what());
    } else if (writer.text().size() > plistMaximumSize) {
        what = fmt::format("larger than {} bytes", plistMaximumSize);  // it could not be read again
    } else {
        return std::move(writer.text());
    }
    return failure(plist::contentError(std::move(what)));
}

}  // namespace adminhost
