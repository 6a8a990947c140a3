#pragma once

// Property-list values: what requests, answers, settings files and tool output are made of.
//
// A Value is a regular type: copyable, comparable, cheap to move. It owns everything below it. A moved-from Value is
// null. Equality is equality of type and content: the integer 1, the real 1.0 and true are three different values. A
// non-negative integer is one value whichever of the two integer types it was made from.

#include "platform/framework/Export.h"

#include <chrono>
#include <concepts>
#include <cstdint>
#include <initializer_list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace adminhost {

class Value;
struct DictionaryEntry;
struct GivenEntry;

using Data = std::vector<std::uint8_t>;
using Date = std::chrono::sys_seconds;  ///< seconds since 1970-01-01T00:00:00Z, the resolution of a property list
using Array = std::vector<Value>;

/// String-keyed values in insertion order. Each key is there at most once, and never with a null value: storing null
/// removes the key. Look-up takes constant time however many keys there are; removal is linear.
/// Iterators and pointers to values are invalidated by every change.
class ADMINHOST_EXPORT Dictionary {
  public:
    using const_iterator = std::vector<DictionaryEntry>::const_iterator;

    Dictionary() noexcept;
    /// `Dictionary{{"key", value}, ...}`. The values are moved into the dictionary: std::move() in the list copies
    /// nothing. A later entry replaces an earlier one of the same key; one with a null value removes it.
    Dictionary(std::initializer_list<GivenEntry> entries);
    Dictionary(const Dictionary&);
    Dictionary(Dictionary&&) noexcept;
    Dictionary& operator=(const Dictionary&);
    Dictionary& operator=(Dictionary&&) noexcept;
    ~Dictionary();

    /// The value under the key, or null if there is none.
    [[nodiscard]] const Value* find(std::string_view key) const noexcept;
    [[nodiscard]] Value* find(std::string_view key) noexcept;
    [[nodiscard]] bool contains(std::string_view key) const noexcept { return find(key) != nullptr; }
    /// The value under the key; a null Value (a static object) if there is none.
    [[nodiscard]] const Value& get(std::string_view key) const noexcept;
    /// The text of the string under the key; empty if there is no value under it or one of another type. Converts
    /// nothing. Refers to the value in the dictionary, so it is valid only as long as a pointer from find() is.
    [[nodiscard]] std::string_view text(std::string_view key) const noexcept;
    /// Follows a key path ("outer.inner") through nested dictionaries; a null Value if it ends early.
    [[nodiscard]] const Value& at(std::string_view keyPath) const noexcept;

    /// Stores the value; an existing key keeps its place. A null value removes the key.
    void set(std::string_view key, Value value);
    /// Stores the value under a key that is known not to be there, without looking for it. The value is not null.
    void append(std::string_view key, Value value);
    /// Removes the key. Returns false if it is not there.
    bool remove(std::string_view key);
    void clear() noexcept;

    [[nodiscard]] std::size_t size() const noexcept;
    [[nodiscard]] bool empty() const noexcept;
    [[nodiscard]] const_iterator begin() const noexcept;
    [[nodiscard]] const_iterator end() const noexcept;

    /// Same keys with equal values, in any order.
    ADMINHOST_EXPORT friend bool operator==(const Dictionary& a, const Dictionary& b);

  private:
    [[nodiscard]] std::size_t indexOf(std::string_view key) const noexcept;
    void rebuildIndex();

    struct Index;

    std::vector<DictionaryEntry> _entries;
    /// Only there once there are more than a few keys: every Value is as large as a Dictionary.
    std::unique_ptr<Index> _index;
};

class ADMINHOST_EXPORT Value {
  public:
    enum class Type { null, boolean, integer, real, string, date, data, array, dictionary };

    Value() noexcept = default;
    Value(std::nullptr_t) noexcept {}
    template <std::same_as<bool> B>
    Value(B value) noexcept : _value(value) {}
    template <std::integral I>
    requires(!std::same_as<I, bool> && !std::same_as<I, char>) Value(I value)
    noexcept {
        if constexpr (std::unsigned_integral<I>) {
            if (value > static_cast<std::uint64_t>(INT64_MAX)) {
                _value = static_cast<std::uint64_t>(value);
                return;
            }
        }
        _value = static_cast<std::int64_t>(value);
    }
    Value(double value) noexcept : _value(value) {}
    Value(std::string value) noexcept : _value(std::move(value)) {}
    Value(std::string_view value) : _value(std::string(value)) {}
    Value(const char* value) : _value(std::string(value)) {}
    Value(Date value) noexcept : _value(value) {}
    Value(Data value) noexcept : _value(std::move(value)) {}
    Value(Array value) noexcept;
    Value(Dictionary value) noexcept : _value(std::move(value)) {}
    Value(const Value&);
    Value(Value&&) noexcept;
    Value& operator=(const Value&);
    Value& operator=(Value&&) noexcept;
    ~Value();

    [[nodiscard]] Type type() const noexcept;
    [[nodiscard]] bool isNull() const noexcept { return std::holds_alternative<std::monostate>(_value); }
    [[nodiscard]] bool isInteger() const noexcept { return type() == Type::integer; }

    // Each returns null (or nullopt) if the value is of another type; none converts.
    [[nodiscard]] std::optional<bool> boolean() const noexcept;
    /// Also nullopt for an integer above the signed range.
    [[nodiscard]] std::optional<std::int64_t> integer() const noexcept;
    /// Also nullopt for a negative integer.
    [[nodiscard]] std::optional<std::uint64_t> unsignedInteger() const noexcept;
    [[nodiscard]] std::optional<double> real() const noexcept;
    [[nodiscard]] std::optional<Date> date() const noexcept;
    [[nodiscard]] const std::string* string() const noexcept { return std::get_if<std::string>(&_value); }
    [[nodiscard]] const Data* data() const noexcept { return std::get_if<Data>(&_value); }
    [[nodiscard]] const Array* array() const noexcept;
    [[nodiscard]] Array* array() noexcept;
    [[nodiscard]] const Dictionary* dictionary() const noexcept { return std::get_if<Dictionary>(&_value); }
    [[nodiscard]] Dictionary* dictionary() noexcept { return std::get_if<Dictionary>(&_value); }

    ADMINHOST_EXPORT friend bool operator==(const Value& a, const Value& b);

  private:
    std::variant<std::monostate, bool, std::int64_t, std::uint64_t, double, std::string, Date, Data, Array, Dictionary>
        _value;
};

struct ADMINHOST_EXPORT DictionaryEntry {
    std::string key;
    Value value;

    friend bool operator==(const DictionaryEntry&, const DictionaryEntry&) = default;
};

/// One entry of a list that initialises a dictionary. The elements of a std::initializer_list are constant, and only a
/// mutable member can be moved out of them. A list is therefore good for one dictionary: write it in place.
struct ADMINHOST_EXPORT GivenEntry {
    std::string_view key;
    mutable Value value;
};

/// The name of a type as messages to people use it: "text", "dictionary", "whole number", ...
[[nodiscard]] ADMINHOST_EXPORT std::string_view nameOf(Value::Type type) noexcept;

}  // namespace adminhost
