#include "platform/value/Value.h"

#include <algorithm>
#include <unordered_map>
#include <utility>

namespace adminhost {
namespace {

/// Up to this many keys a look-up compares keys one by one. An index would be as fast, but needs more memory than the
/// entries of a database row.
constexpr std::size_t linearLimit = 32;
/// Entries for which a dictionary has room at first, and by which it grows afterwards up to that limit. Doubling would
/// leave much of the memory of many rows unused.
constexpr std::size_t firstRoom = 8;
constexpr std::size_t growth = 4;
constexpr std::size_t notFound = static_cast<std::size_t>(-1);
const Value nullValue;

}  // namespace

/// The place of each key's entry.
struct Dictionary::Index {
    struct Hash {
        using is_transparent = void;
        std::size_t operator()(std::string_view text) const noexcept { return std::hash<std::string_view>{}(text); }
    };
    std::unordered_map<std::string, std::size_t, Hash, std::equal_to<>> places;
};

Dictionary::Dictionary() noexcept = default;
Dictionary::Dictionary(const Dictionary& other) : _entries(other._entries) {
    rebuildIndex();
}
Dictionary::Dictionary(Dictionary&&) noexcept = default;
Dictionary& Dictionary::operator=(const Dictionary& other) {
    return *this = Dictionary(other);
}
Dictionary& Dictionary::operator=(Dictionary&&) noexcept = default;
Dictionary::~Dictionary() = default;

Dictionary::Dictionary(std::initializer_list<GivenEntry> entries) {
    for (const GivenEntry& entry : entries) {
        set(entry.key, std::move(entry.value));
    }
}

std::size_t Dictionary::indexOf(std::string_view key) const noexcept {
    if (_entries.size() <= linearLimit) {
        const auto found = std::find_if(_entries.begin(), _entries.end(),
                                        [&](const DictionaryEntry& entry) { return entry.key == key; });
        return found == _entries.end() ? notFound : static_cast<std::size_t>(found - _entries.begin());
    }
    const auto found = _index->places.find(key);
    return found == _index->places.end() ? notFound : found->second;
}

void Dictionary::rebuildIndex() {
    _index.reset();
    if (_entries.size() <= linearLimit) {
        return;
    }
    _index = std::make_unique<Index>();
    for (std::size_t i = 0; i < _entries.size(); ++i) {
        _index->places.emplace(_entries[i].key, i);
    }
}

const Value* Dictionary::find(std::string_view key) const noexcept {
    const std::size_t index = indexOf(key);
    return index == notFound ? nullptr : &_entries[index].value;
}

Value* Dictionary::find(std::string_view key) noexcept {
    const std::size_t index = indexOf(key);
    return index == notFound ? nullptr : &_entries[index].value;
}

const Value& Dictionary::get(std::string_view key) const noexcept {
    const Value* value = find(key);
    return value == nullptr ? nullValue : *value;
}

std::string_view Dictionary::text(std::string_view key) const noexcept {
    const std::string* string = get(key).string();
    return string == nullptr ? std::string_view() : std::string_view(*string);
}

const Value& Dictionary::at(std::string_view keyPath) const noexcept {
    const Dictionary* dictionary = this;
    for (;;) {
        const std::size_t dot = keyPath.find('.');
        const Value& value = dictionary->get(keyPath.substr(0, dot));
        if (dot == std::string_view::npos) {
            return value;
        }
        dictionary = value.dictionary();
        if (dictionary == nullptr) {
            return nullValue;
        }
        keyPath.remove_prefix(dot + 1);
    }
}

void Dictionary::set(std::string_view key, Value value) {
    if (value.isNull()) {
        remove(key);
        return;
    }
    const std::size_t index = indexOf(key);
    if (index != notFound) {
        _entries[index].value = std::move(value);
        return;
    }
    append(key, std::move(value));
}

void Dictionary::append(std::string_view key, Value value) {
    std::string copiedKey(key);  // before anything moves: it may be the text of a value in this dictionary
    if (_entries.size() == _entries.capacity() && _entries.size() < linearLimit) {
        _entries.reserve(_entries.empty() ? firstRoom : _entries.size() + growth);
    }
    DictionaryEntry& entry = _entries.emplace_back();
    entry.key = std::move(copiedKey);
    entry.value = std::move(value);
    if (_entries.size() == linearLimit + 1) {
        rebuildIndex();
    } else if (_entries.size() > linearLimit) {
        _index->places.emplace(entry.key, _entries.size() - 1);
    }
}

bool Dictionary::remove(std::string_view key) {
    const std::size_t index = indexOf(key);
    if (index == notFound) {
        return false;
    }
    _entries.erase(_entries.begin() + static_cast<std::ptrdiff_t>(index));
    rebuildIndex();
    return true;
}

void Dictionary::clear() noexcept {
    _entries.clear();
    _index.reset();
}

std::size_t Dictionary::size() const noexcept {
    return _entries.size();
}
bool Dictionary::empty() const noexcept {
    return _entries.empty();
}
Dictionary::const_iterator Dictionary::begin() const noexcept {
    return _entries.begin();
}
Dictionary::const_iterator Dictionary::end() const noexcept {
    return _entries.end();
}

bool operator==(const Dictionary& a, const Dictionary& b) {
    return a.size() == b.size() && std::all_of(a.begin(), a.end(), [&](const DictionaryEntry& entry) {
               const Value* other = b.find(entry.key);
               return other != nullptr && *other == entry.value;
           });
}

Value::Value(Array value) noexcept : _value(std::move(value)) {}
Value::Value(const Value&) = default;
Value::Value(Value&& other) noexcept : _value(std::move(other._value)) {
    other._value.emplace<std::monostate>();
}
Value& Value::operator=(const Value&) = default;
Value& Value::operator=(Value&& other) noexcept {
    if (this != &other) {
        // Moved out first: the other value may be inside this one.
        auto taken = std::exchange(other._value, std::monostate{});
        _value = std::move(taken);
    }
    return *this;
}
Value::~Value() = default;

Value::Type Value::type() const noexcept {
    constexpr Type types[] = {Type::null,   Type::boolean, Type::integer, Type::integer, Type::real,
                              Type::string, Type::date,    Type::data,    Type::array,   Type::dictionary};
    return types[_value.index()];
}

std::optional<bool> Value::boolean() const noexcept {
    const bool* value = std::get_if<bool>(&_value);
    return value == nullptr ? std::nullopt : std::optional(*value);
}

std::optional<std::int64_t> Value::integer() const noexcept {
    const auto* value = std::get_if<std::int64_t>(&_value);
    return value == nullptr ? std::nullopt : std::optional(*value);
}

std::optional<std::uint64_t> Value::unsignedInteger() const noexcept {
    if (const auto* value = std::get_if<std::uint64_t>(&_value)) {
        return *value;
    }
    const auto* value = std::get_if<std::int64_t>(&_value);
    return value == nullptr || *value < 0 ? std::nullopt : std::optional(static_cast<std::uint64_t>(*value));
}

std::optional<double> Value::real() const noexcept {
    const double* value = std::get_if<double>(&_value);
    return value == nullptr ? std::nullopt : std::optional(*value);
}

std::optional<Date> Value::date() const noexcept {
    const Date* value = std::get_if<Date>(&_value);
    return value == nullptr ? std::nullopt : std::optional(*value);
}

const Array* Value::array() const noexcept {
    return std::get_if<Array>(&_value);
}
Array* Value::array() noexcept {
    return std::get_if<Array>(&_value);
}

bool operator==(const Value& a, const Value& b) {
    return a._value == b._value;
}

std::string_view nameOf(Value::Type type) noexcept {
    switch (type) {
        case Value::Type::null:
            return "null";
        case Value::Type::boolean:
            return "true or false";
        case Value::Type::integer:
            return "whole number";
        case Value::Type::real:
            return "number";
        case Value::Type::string:
            return "text";
        case Value::Type::date:
            return "date";
        case Value::Type::data:
            return "data";
        case Value::Type::array:
            return "list";
        case Value::Type::dictionary:
            return "dictionary";
    }
    return "value";
}

}  // namespace adminhost
