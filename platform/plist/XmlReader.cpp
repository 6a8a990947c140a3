#include "platform/plist/PropertyList.h"
#include "platform/plist/Readers.h"
#include "platform/text/Base64Text.h"
#include "platform/text/IsoDate.h"
#include "platform/text/LineAndColumn.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstdlib>
#include <cstring>
#include <exception>
#include <memory>
#include <utility>
#include <vector>

#include <expat.h>
#include <fmt/format.h>
#include <malloc.h>

namespace adminhost::plist {
namespace {

enum class XmlElement { plist, dict, array, key, string, integer, real, date, data, true_, false_, unknown };

constexpr std::array<std::string_view, 11> elementNames = {"plist", "dict", "array", "key",  "string", "integer",
                                                           "real",  "date", "data",  "true", "false"};

/// Called for every element of a list: the first letter leaves one or two names to compare.
XmlElement elementOf(std::string_view name) noexcept {
    const auto either = [&](XmlElement element, XmlElement other = XmlElement::unknown) {
        for (const XmlElement candidate : {element, other}) {
            if (candidate != XmlElement::unknown && elementNames[static_cast<std::size_t>(candidate)] == name) {
                return candidate;
            }
        }
        return XmlElement::unknown;
    };
    switch (name.empty() ? '\0' : name.front()) {
        case 'k':
            return either(XmlElement::key);
        case 's':
            return either(XmlElement::string);
        case 'i':
            return either(XmlElement::integer);
        case 'd':
            return name.size() > 1 && name[1] == 'i' ? either(XmlElement::dict)
                                                     : either(XmlElement::data, XmlElement::date);
        case 't':
            return either(XmlElement::true_);
        case 'f':
            return either(XmlElement::false_);
        case 'a':
            return either(XmlElement::array);
        case 'r':
            return either(XmlElement::real);
        default:
            return either(XmlElement::plist);
    }
}

std::string_view nameOf(XmlElement element) noexcept {
    return elementNames.at(static_cast<std::size_t>(element));
}

/// Shortens names and keys from a file for a message.
std::string shortened(std::string_view text) {
    constexpr std::size_t longest = 60;
    if (text.size() <= longest) {
        return std::string(text);
    }
    std::size_t end = longest;
    while (end > 0 && continuesCharacter(text[end])) {
        --end;
    }
    return std::string(text.substr(0, end)) + "...";
}

constexpr std::string_view whiteSpace = " \t\r\n";

constexpr bool isWhiteSpace(char c) noexcept {
    return c == '\t' || c == '\n' || c == ' ' || c == '\r';
}

/// Fast path: most character events of an indented list are white space, and the library's search is slower.
bool isAllWhiteSpace(std::string_view text) noexcept {
    return std::all_of(text.begin(), text.end(), isWhiteSpace);
}

std::string_view trimmed(std::string_view text) noexcept {
    const std::size_t first = text.find_first_not_of(whiteSpace);
    if (first == std::string_view::npos) {
        return {};
    }
    return text.substr(first, text.find_last_not_of(whiteSpace) + 1 - first);
}

template <typename Number>
bool readWhole(std::string_view text, Number& number) noexcept {
    const auto [end, failure] = std::from_chars(text.data(), text.data() + text.size(), number);
    return failure == std::errc{} && end == text.data() + text.size();
}

/// Decimal digits after an optional sign; the format has no hexadecimal form.
std::optional<Value> integerOf(std::string_view text) {
    if (text.starts_with('+') && text.size() > 1 && text[1] != '-') {
        text.remove_prefix(1);
    }
    std::int64_t negative = 0;
    std::uint64_t positive = 0;
    if (text.starts_with('-')) {
        return readWhole(text, negative) ? std::optional<Value>(negative) : std::nullopt;
    }
    return readWhole(text, positive) ? std::optional<Value>(positive) : std::nullopt;
}

std::optional<Value> realOf(std::string_view text) {
    if (text.starts_with('+') && text.size() > 1 && text[1] != '-') {
        text.remove_prefix(1);
    }
    double number = 0;
    // "nan(...)" is the C library's, not the format's.
    if (text.find('(') != std::string_view::npos || !readWhole(text, number)) {
        return std::nullopt;
    }
    return number;
}

/// "2026-01-31T08:00:00Z": a date whose year has four digits.
std::optional<Value> dateOf(std::string_view text) {
    const auto date = isoDateOf(text);
    return date && hasFourDigitYear(*date) ? std::optional<Value>(*date) : std::nullopt;
}

// expat's memory holds the text of the list, which may have secrets: it is cleared before it is freed.

void clearAndFree(void* block) {
    if (block != nullptr) {
        ::explicit_bzero(block, ::malloc_usable_size(block));
        std::free(block);
    }
}

/// Unlike realloc, leaves no copy behind.
void* resize(void* block, std::size_t size) {
    void* const larger = std::malloc(size);
    if (larger != nullptr && block != nullptr) {
        std::memcpy(larger, block, std::min(size, ::malloc_usable_size(block)));
        clearAndFree(block);
    }
    return larger;
}

constexpr XML_Memory_Handling_Suite clearedMemory = {&std::malloc, &resize, &clearAndFree};

class XmlReader {
  public:
    XmlReader(const char* encoding, std::size_t valuesMaximum)
        : _parser(::XML_ParserCreate_MM(encoding, &clearedMemory, nullptr), &::XML_ParserFree),
          _valuesMaximum(valuesMaximum) {
        if (!_parser) {
            throw std::bad_alloc();
        }
        XML_Parser parser = _parser.get();
        ::XML_SetUserData(parser, this);
        ::XML_SetElementHandler(
            parser,
            [](void* self, const XML_Char* name, const XML_Char** attributes) {
                guarded(self, [&](XmlReader& reader) { reader.begin(name, attributes); });
            },
            [](void* self, const XML_Char*) { guarded(self, [](XmlReader& reader) { reader.end(); }); });
        ::XML_SetCharacterDataHandler(parser, [](void* self, const XML_Char* text, int length) {
            guarded(self, [&](XmlReader& reader) { reader.characters({text, static_cast<std::size_t>(length)}); });
        });
        ::XML_SetStartDoctypeDeclHandler(
            parser, [](void* self, const XML_Char*, const XML_Char*, const XML_Char*, int hasInternalSubset) {
                guarded(self, [&](XmlReader& reader) {
                    if (hasInternalSubset != 0) {
                        reader.fail("a document type with an internal subset is not accepted");
                    }
                });
            });
        // After a document type expat passes over entities that it does not know; their text would be missing.
        ::XML_SetSkippedEntityHandler(parser, [](void* self, const XML_Char* name, int) {
            guarded(self, [&](XmlReader& reader) { reader.fail(fmt::format("unknown entity &{};", shortened(name))); });
        });
    }

    XmlReader(const XmlReader&) = delete;
    XmlReader& operator=(const XmlReader&) = delete;
    /// Clears the text, because the list may be a file of secrets.
    ~XmlReader() {
        _text.resize(_text.capacity());
        ::explicit_bzero(_text.data(), _text.size());
    }

    Result<Value> parse(std::string_view bytes) {
        const auto status = ::XML_Parse(_parser.get(), bytes.data(), static_cast<int>(bytes.size()), XML_TRUE);
        if (_message.empty() && status != XML_STATUS_OK) {
            fail(::XML_ErrorString(::XML_GetErrorCode(_parser.get())));
        }
        if (!_message.empty()) {
            Error error = contentError(std::move(_message));
            error.code = _values > _valuesMaximum ? plistTooManyValues : error.code;
            return failure(std::move(error));
        }
        return *std::move(_root);
    }

  private:
    struct Container {
        bool isDictionary = false;
        bool hasKey = false;
        std::string key;
        Dictionary dictionary;
        Array array;
    };

    /// Runs a handler; nothing may be thrown through expat's own frames.
    template <typename Handler>
    static void guarded(void* self, Handler handler) noexcept {
        XmlReader& reader = *static_cast<XmlReader*>(self);
        if (!reader._message.empty()) {
            return;  // expat may still call for a moment after XML_StopParser()
        }
        try {
            handler(reader);
        } catch (const std::exception& failure) {
            reader.fail(failure.what());
        }
    }

    void fail(std::string_view what) {
        _message = fmt::format("line {}, column {}: {}", ::XML_GetCurrentLineNumber(_parser.get()),
                               ::XML_GetCurrentColumnNumber(_parser.get()) + 1, what);
        ::XML_StopParser(_parser.get(), XML_FALSE);
    }

    void begin(std::string_view name, const XML_Char** attributes) {
        const XmlElement element = elementOf(name);
        if (element == XmlElement::unknown) {
            return fail(fmt::format("unknown element <{}>", shortened(name)));
        }
        if (_leaf) {
            return fail(fmt::format("<{}> inside <{}>", name, nameOf(*_leaf)));
        }
        for (const XML_Char** attribute = attributes; *attribute != nullptr; attribute += 2) {
            if (element != XmlElement::plist || std::strcmp(attribute[0], "version") != 0) {
                return fail(fmt::format("<{}> with an unknown attribute {}", name, shortened(attribute[0])));
            }
            if (std::strcmp(attribute[1], "1.0") != 0) {
                return fail(fmt::format("unknown version \"{}\"", shortened(attribute[1])));
            }
        }
        if ((element == XmlElement::plist) == _inPlist) {
            return fail(_inPlist ? "<plist> inside <plist>" : fmt::format("<{}> instead of <plist>", name));
        }
        if (element == XmlElement::plist) {
            _inPlist = true;
            return;
        }
        if (!mayStand(element)) {
            return;
        }
        if (element != XmlElement::dict && element != XmlElement::array) {
            _leaf = element;
            _text.clear();
            return;
        }
        if (_containers.size() == static_cast<std::size_t>(plistMaximumDepth)) {
            return fail(fmt::format("nested more than {} deep", plistMaximumDepth));
        }
        _containers.emplace_back().isDictionary = element == XmlElement::dict;
    }

    /// Returns true if the element may come at this place; if not, sets the error.
    bool mayStand(XmlElement element) {
        if (_containers.empty()) {
            if (_root || element == XmlElement::key) {
                fail(_root ? "a second value in <plist>" : "<key> outside <dict>");
                return false;
            }
            return true;
        }
        const Container& parent = _containers.back();
        if (!parent.isDictionary && element == XmlElement::key) {
            fail("<key> inside <array>");
        } else if (parent.isDictionary && parent.hasKey && element == XmlElement::key) {
            fail(fmt::format("the key \"{}\" has no value", shortened(parent.key)));
        } else if (parent.isDictionary && !parent.hasKey && element != XmlElement::key) {
            fail(fmt::format("<{}> without a key", nameOf(element)));
        } else {
            return true;
        }
        return false;
    }

    void characters(std::string_view text) {
        if (_leaf) {
            _text.append(text);
        } else if (!isAllWhiteSpace(text)) {
            fail("text outside the elements that hold text");
        }
    }

    void end() {
        if (_leaf) {
            endLeaf(*std::exchange(_leaf, std::nullopt));
        } else if (!_containers.empty()) {
            Container container = std::move(_containers.back());
            if (container.hasKey) {
                return fail(fmt::format("the key \"{}\" has no value", shortened(container.key)));
            }
            _containers.pop_back();
            store(container.isDictionary ? Value(std::move(container.dictionary)) : Value(std::move(container.array)));
        } else if (!_root) {
            fail("<plist> without a value");
        }
    }

    void endLeaf(XmlElement element) {
        std::optional<Value> value;
        switch (element) {
            case XmlElement::key:
                _containers.back().key.swap(_text);
                _containers.back().hasKey = true;
                return;
            case XmlElement::string:
                value = Value(_text);
                break;
            case XmlElement::integer:
                value = integerOf(trimmed(_text));
                break;
            case XmlElement::real:
                value = realOf(trimmed(_text));
                break;
            case XmlElement::date:
                value = dateOf(trimmed(_text));
                break;
            case XmlElement::data:
                std::erase_if(_text, isWhiteSpace);
                if (auto data = bytesOfBase64Text(_text)) {
                    value = Value(std::move(*data));
                }
                break;
            default:
                if (_text.empty()) {
                    value = Value(element == XmlElement::true_);
                }
        }
        if (!value) {
            // Without the text itself: a list may hold values that must not appear in an error message.
            return fail(fmt::format("this text is not a valid <{}>", nameOf(element)));
        }
        store(std::move(*value));
    }

    void store(Value value) {
        if (++_values > _valuesMaximum) {
            return fail(tooManyValues(_valuesMaximum));
        }
        if (_containers.empty()) {
            _root = std::move(value);
            return;
        }
        Container& parent = _containers.back();
        if (!parent.isDictionary) {
            parent.array.push_back(std::move(value));
            return;
        }
        const std::size_t before = parent.dictionary.size();
        parent.dictionary.set(parent.key, std::move(value));
        parent.hasKey = false;
        if (parent.dictionary.size() == before) {
            fail(fmt::format("the key \"{}\" occurs twice", shortened(parent.key)));
        }
    }

    std::unique_ptr<XML_ParserStruct, decltype(&::XML_ParserFree)> _parser;
    std::string _message;  ///< of the first error
    std::vector<Container> _containers;
    std::optional<XmlElement> _leaf;  ///< the open element that holds text
    std::string _text;                ///< of that element
    std::optional<Value> _root;
    bool _inPlist = false;
    std::size_t _valuesMaximum;
    std::size_t _values = 0;
};

}  // namespace

Result<Value> parseXml(std::string_view bytes, std::size_t valuesMaximum) {
    using namespace std::string_view_literals;
    const bool bigEndian = bytes.starts_with("\xFE\xFF"sv) || bytes.starts_with("\0<"sv);
    if (!bigEndian && !bytes.starts_with("\xFF\xFE"sv) && !bytes.starts_with("<\0"sv)) {
        return XmlReader(nullptr, valuesMaximum).parse(bytes);
    }
    // expat does not notice unpaired surrogates in UTF-16, so it gets the text in UTF-8.
    if (bytes.front() != '<' && bytes.front() != '\0') {
        bytes.remove_prefix(2);
    }
    const FromUtf16 converted = utf8OfUtf16(bytes, bigEndian);
    if (converted.end < bytes.size()) {
        return failure(contentError(lineAndColumnAfter(converted.text) + ": invalid UTF-16"));
    }
    return XmlReader("UTF-8", valuesMaximum).parse(converted.text);
}

}  // namespace adminhost::plist
