#include "platform/json/Json.h"
#include "platform/text/Base64Text.h"
#include "platform/text/IsoDate.h"
#include "platform/text/LineAndColumn.h"

#include <algorithm>
#include <iterator>
#include <limits>
#include <set>

#include <fmt/format.h>
#include <nlohmann/json.hpp>

namespace adminhost {
namespace {

/// Walks the text and remembers how far the parser has read, which its events do not report.
class CountingIterator {
  public:
    using iterator_category = std::input_iterator_tag;
    using value_type = char;
    using difference_type = std::ptrdiff_t;
    using pointer = const char*;
    using reference = const char&;

    CountingIterator(const char* at, const char** reached) : _at(at), _reached(reached) {}
    reference operator*() const { return *_at; }
    CountingIterator& operator++() {
        ++_at;
        *_reached = _at;
        return *this;
    }
    friend bool operator==(const CountingIterator& a, const CountingIterator& b) { return a._at == b._at; }

  private:
    const char* _at;
    const char** _reached;
};

/// Receives the parser's events and builds the value. Every event returns true to go on.
class Builder {
  public:
    using Json = nlohmann::json;

    explicit Builder(std::size_t valuesMaximum) : _valuesMaximum(valuesMaximum) {}

    bool null();
    bool boolean(bool value) { return add(Value(value)); }
    bool number_integer(std::int64_t value) { return add(Value(value)); }
    bool number_unsigned(std::uint64_t value) { return add(Value(value)); }
    bool number_float(double value, const std::string& text);
    bool string(const std::string& value);
    bool binary(const Json::binary_t&) { return fail("JSON has no binary values"); }
    bool start_object(std::size_t) { return open(Dictionary()); }
    bool start_array(std::size_t) { return open(Array()); }
    bool key(const std::string& key);
    bool end_object() { return close(); }
    bool end_array() { return close(); }
    bool parse_error(std::size_t position, const std::string&, const Json::exception& exception);

    [[nodiscard]] Value take() { return std::move(_root); }
    [[nodiscard]] const std::string& problem() const { return _problem; }
    [[nodiscard]] bool tooMany() const { return _values > _valuesMaximum; }
    [[nodiscard]] std::optional<std::size_t> position() const { return _position; }

  private:
    struct Level {
        Value container;
        std::string key;
        std::string form;                ///< "$date" and its like: the object is one such value
        Value formed;                    ///< that value
        std::set<std::string> nullKeys;  ///< they leave no trace in the dictionary, but must not occur twice
    };

    bool fail(std::string problem) {
        _problem = std::move(problem);
        return false;
    }
    bool open(Value container);
    bool close();
    bool add(Value value);
    bool count();

    std::size_t _valuesMaximum;
    std::size_t _values = 0;
    std::vector<Level> _levels;
    Value _root;
    std::string _problem;
    std::optional<std::size_t> _position;
};

bool Builder::open(Value container) {
    if (_levels.size() == jsonMaximumDepth) {
        return fail(fmt::format("lists and dictionaries are nested more than {} deep", jsonMaximumDepth));
    }
    if (!_levels.empty() && !_levels.back().form.empty()) {
        return fail(fmt::format("\"{}\" must be a text", _levels.back().form));
    }
    _levels.push_back({std::move(container), {}, {}, {}, {}});
    return true;
}

bool Builder::close() {
    Level level = std::move(_levels.back());
    _levels.pop_back();
    return add(level.form.empty() ? std::move(level.container) : std::move(level.formed));
}

bool Builder::count() {
    return ++_values <= _valuesMaximum || fail(fmt::format("there are more than {} values", _valuesMaximum));
}

bool Builder::add(Value value) {
    if (!count()) {
        return false;
    }
    if (_levels.empty()) {
        _root = std::move(value);
        return true;
    }
    Level& level = _levels.back();
    if (!level.form.empty()) {
        return fail(fmt::format("\"{}\" must be a text", level.form));
    }
    if (Array* array = level.container.array()) {
        array->push_back(std::move(value));
    } else {
        level.container.dictionary()->set(level.key, std::move(value));
    }
    return true;
}

bool Builder::null() {
    if (_levels.empty()) {
        return true;
    }
    Level& level = _levels.back();
    if (level.container.array() != nullptr) {
        return fail("null is not allowed in a list");
    }
    if (!level.form.empty()) {
        return fail(fmt::format("\"{}\" must be a text", level.form));
    }
    level.nullKeys.insert(level.key);
    return count();
}

bool Builder::number_float(double value, const std::string& text) {
    if (text.find_first_of(".eE") == std::string::npos) {
        return fail("the integer does not fit in 64 bits");
    }
    return add(Value(value));
}

bool Builder::string(const std::string& value) {
    if (_levels.empty() || _levels.back().form.empty()) {
        return add(Value(value));
    }
    Level& level = _levels.back();
    if (level.form == "$date") {
        const auto date = isoDateOf(value);
        if (!date) {
            return fail("a date is written as {\"$date\": \"2026-01-31T08:00:00Z\"}");
        }
        level.formed = *date;
    } else if (level.form == "$data") {
        auto data = bytesOfBase64Text(value);
        if (!data) {
            return fail("data is written as {\"$data\": BASE64}, with padding and without line feeds");
        }
        level.formed = std::move(*data);
    } else if (value == "nan") {
        level.formed = std::numeric_limits<double>::quiet_NaN();
    } else if (value == "infinity" || value == "-infinity") {
        level.formed = std::numeric_limits<double>::infinity() * (value.front() == '-' ? -1 : 1);
    } else {
        return fail("\"$real\" must be nan, infinity or -infinity");
    }
    return true;
}

bool Builder::key(const std::string& key) {
    Level& level = _levels.back();
    const bool empty = level.container.dictionary()->empty() && level.nullKeys.empty();
    if (!level.form.empty()) {
        return fail(fmt::format("\"{}\" must be its dictionary's only key", level.form));
    }
    if (key.starts_with('$') && !key.starts_with("$$")) {
        if (key != "$date" && key != "$data" && key != "$real") {
            return fail("a key that begins with \"$\" is written with a second \"$\"");
        }
        if (!empty) {
            return fail(fmt::format("\"{}\" must be its dictionary's only key", key));
        }
        level.form = key;
        return true;
    }
    level.key = key.starts_with('$') ? key.substr(1) : key;
    if (level.container.dictionary()->contains(level.key) || level.nullKeys.contains(level.key)) {
        return fail(fmt::format("the key \"{}\" occurs twice", key));
    }
    return true;
}

bool Builder::parse_error(std::size_t position, const std::string&, const Json::exception& exception) {
    std::string_view text = exception.what();
    for (const std::string_view before : {std::string_view("] "), std::string_view("syntax error while parsing ")}) {
        if (const std::size_t at = text.find(before); at != std::string_view::npos) {
            text.remove_prefix(at + before.size());
        }
    }
    // The last part read may hold bytes that are not UTF-8, and values that must not appear in an error message.
    text = text.substr(0, text.find("; last read"));
    text = text.substr(0, text.find(" parsing '"));
    _position = position;
    return fail(std::string(text));
}

}  // namespace

Result<Value> parseJson(std::string_view text, std::size_t valuesMaximum) {
    const char* reached = text.data();
    Builder builder(valuesMaximum);
    if (Builder::Json::sax_parse(CountingIterator(text.data(), &reached),
                                 CountingIterator(text.data() + text.size(), &reached), &builder)) {
        // The parser reads a NUL as the end of its input. It has rejected one inside a value.
        const std::size_t nul = text.find('\0');
        if (nul == std::string_view::npos) {
            return builder.take();
        }
        return failure(
            Error{"json", 1, lineAndColumnAfter(text.substr(0, nul)) + ": only white space may follow the value"});
    }
    const std::size_t consumed = builder.position().value_or(static_cast<std::size_t>(reached - text.data()));
    // The last character that was read is the offending one.
    return failure(
        Error{"json", builder.tooMany() ? jsonTooManyValues : 1,
              lineAndColumnAfter(text.substr(0, consumed == 0 ? 0 : consumed - 1)) + ": " + builder.problem()});
}

}  // namespace adminhost
