// The check of a request before it reaches an operation. Operations put values unchanged into statements and arguments.
// If a value does not fit, the whole request is therefore refused here, before anything has been changed.

#include "commands/CommandTable.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <array>
#include <string>

namespace lumio {
namespace {

using adminhost::Dictionary;
using adminhost::Finding;
using adminhost::Value;

/// One argument may have 128 KiB. A text of this many bytes still fits its statement after it was protected, which
/// makes it longer by a good third.
constexpr std::size_t maximumText = 95'000;
/// All arguments of one tool together may have 2 MiB, the environment included.
constexpr std::size_t maximumArguments = 1'500'000;
/// The cost of each short name besides its bytes: its option, two terminating bytes and two pointers.
constexpr std::size_t argumentCost = 32;
constexpr std::size_t maximumDigits = 19;

constexpr std::array<std::string_view, 3> rowNames = {"rowid", "oid", "_rowid_"};

char lower(char c) noexcept {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

/// Without regard to the case of ASCII letters, as the database and the operations compare.
bool equalWithoutCase(std::string_view a, std::string_view b) noexcept {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](char x, char y) { return lower(x) == lower(y); });
}

bool isDigit(char c) noexcept {
    return c >= '0' && c <= '9';
}
bool isIdentifierCharacter(char c) noexcept {
    return isDigit(c) || c == '-' || (lower(c) >= 'a' && lower(c) <= 'z');
}

bool fits(const Value& value, KeyType type) noexcept {
    using T = Value::Type;
    const T is = value.type();
    switch (type) {
        case KeyType::any:
            return true;
        case KeyType::scalar:
            return is == T::string || is == T::integer || is == T::real || is == T::boolean || is == T::date;
        case KeyType::text:
            return is == T::string;
        case KeyType::integer:
            return is == T::integer;
        case KeyType::real:
            return is == T::real || is == T::integer;
        case KeyType::boolean:
            return is == T::boolean || is == T::integer || is == T::real || is == T::string;
        case KeyType::date:
            return is == T::date;
        case KeyType::data:
            return is == T::data;
        case KeyType::list:
            return is == T::array;
        case KeyType::dictionary:
            return is == T::dictionary;
    }
    return false;
}

std::string_view nameOf(KeyType type) noexcept {
    constexpr std::array<std::string_view, 10> names = {
        "any value", "a single value (text, number, yes or no, date)",
        "a text",    "a whole number",
        "a number",  "yes or no",
        "a date",    "data",
        "a list",    "a dictionary",
    };
    return names[static_cast<std::size_t>(type)];
}

EntryEffect effectOf(const Dictionary& values, const EntryDescription& entry) {
    const auto isSet = [&](std::string_view flag) {
        const Value& value = values.get(flag);
        return !flag.empty() && (entry.leadingZeros ? adminhost::flagOf(value) : adminhost::booleanOf(value));
    };
    const bool added = isSet(entry.addedBy);
    const bool removed = isSet(entry.removedBy);
    if (removed && !(added && entry.addedFirst)) {
        return effectRemoved;
    }
    if (!added) {
        return entry.otherwise;
    }
    const std::string* kind = values.get("type").string();
    const bool known = entry.addedKinds.empty() ||
                       (kind != nullptr && std::any_of(entry.addedKinds.begin(), entry.addedKinds.end(),
                                                       [&](std::string_view k) { return equalWithoutCase(k, *kind); }));
    return known ? effectAdded : effectNothing;
}

/// Walks a configuration along its description and collects the key paths that the description does not name.
class UnknownKeys {
  public:
    explicit UnknownKeys(std::vector<std::string>& paths) noexcept : _paths(paths) {}

    void value(const Value& value, const KeyDescription& key, const std::string& path) {
        if (key.children.empty()) {
            return;
        }
        if (const Dictionary* values = value.dictionary()) {
            dictionary(*values, key, path);
        } else if (const adminhost::Array* elements = value.array()) {
            for (std::size_t i = 0; i < elements->size(); ++i) {
                this->value((*elements)[i], key.children.front(), path + '.' + std::to_string(i));
            }
        }
    }

  private:
    void dictionary(const Dictionary& values, const KeyDescription& key, const std::string& path) {
        if (key.entry != nullptr && effectOf(values, *key.entry) == effectNothing) {
            return;  // it is only for display, as reading returned it
        }
        for (const adminhost::DictionaryEntry& entry : values) {
            const std::string at = path + '.' + entry.key;
            const auto known = std::find_if(key.children.begin(), key.children.end(),
                                            [&](const KeyDescription& child) { return child.name == entry.key; });
            if (known != key.children.end()) {
                value(entry.value, *known, at);
            } else if (key.entry == nullptr || !isColumn(entry.key, *key.entry)) {
                _paths.push_back(at);
            }
        }
    }

    /// Returns true if reading returns the key, so that a client may send it back unchanged.
    static bool isColumn(std::string_view name, const EntryDescription& entry) {
        return std::find(entry.columns.begin(), entry.columns.end(), name) != entry.columns.end();
    }

    std::vector<std::string>& _paths;
};

/// Walks a request along its description and collects the findings.
class Check {
  public:
    explicit Check(std::vector<Finding>& findings) noexcept : _findings(findings) {}

    void dictionary(const Dictionary& values, std::span<const KeyDescription> keys, const EntryDescription* entry,
                    const std::string& path) {
        const EntryEffect effect = entry != nullptr ? effectOf(values, *entry) : effectChanged;
        for (const KeyDescription& key : keys) {
            const Value* value = values.find(key.name);
            if (value == nullptr || !isRead(key, values, effect)) {
                continue;
            }
            this->value(*value, key, entry, path.empty() ? std::string(key.name) : path + '.' + std::string(key.name));
        }
        if (entry != nullptr && (effect & (effectAdded | effectChanged)) != 0) {
            together(values, *entry, path);
        }
    }

  private:
    static bool isRead(const KeyDescription& key, const Dictionary& values, EntryEffect effect) {
        if ((key.readFor & effect) == 0) {
            return false;
        }
        return key.with.empty() || effect != effectChanged ||
               std::any_of(key.with.begin(), key.with.end(), [&](std::string_view other) {
                   const Value* value = values.find(other);
                   return value != nullptr && !(value->array() != nullptr && value->array()->empty());
               });
    }

    void value(const Value& value, const KeyDescription& key, const EntryDescription* entry, const std::string& path) {
        if (!fits(value, key.type)) {
            const std::string wanted(nameOf(key.type));
            add(path, "must be " + wanted + ", not " + std::string(adminhost::nameOf(value.type())), "send " + wanted);
            return;
        }
        rules(value, key, entry, path);
        if (key.children.empty()) {
            return;
        }
        if (const Dictionary* values = value.dictionary()) {
            dictionary(*values, key.children, key.entry, path);
        } else if (const adminhost::Array* elements = value.array()) {
            for (std::size_t i = 0; i < elements->size(); ++i) {
                this->value((*elements)[i], key.children.front(), nullptr, path + '.' + std::to_string(i));
            }
        }
    }

    void rules(const Value& value, const KeyDescription& key, const EntryDescription* entry, const std::string& path) {
        if ((key.rules & ruleRowNumber) != 0) {
            rowNumber(value, path);
        }
        if ((key.rules & ruleShortNames) != 0) {
            shortNames(*value.array(), path);
        }
        const std::string* text = value.string();
        if (text == nullptr) {
            return;  // the text forms of numbers, dates and booleans cannot do harm
        }
        if ((key.rules & ruleIdentifier) != 0) {
            identifier(*text, path);
        }
        if ((key.rules & ruleStatement) != 0) {
            statement(*text, path);
            if (entry != nullptr) {
                notARow(*text, *entry, path);
            }
        }
        if ((key.rules & ruleOneLine) != 0 && text->find('\n') != std::string::npos) {
            add(path, "must not hold a line feed", "write it in one line");
        }
        if ((key.rules & ruleArgument) != 0) {
            argument(*text, path);
        }
        if ((key.rules & ruleAbsolutePath) != 0) {
            absolutePath(*text, path);
        }
        if ((key.rules & ruleNotAColumn) != 0 && entry != nullptr) {
            notAColumn(*text, *entry, path);
        }
    }

    void rowNumber(const Value& value, const std::string& path) {
        const std::string* text = value.string();
        const bool good = text != nullptr ? !text->empty() && text->size() <= maximumDigits &&
                                                std::all_of(text->begin(), text->end(), isDigit)
                                          : value.unsignedInteger().has_value();
        if (!good) {
            add(path, "must be a row number: decimal digits only", "send the number that reading returned");
        }
    }

    void identifier(const std::string& text, const std::string& path) {
        if (text.empty() || text.front() == '-' || !std::all_of(text.begin(), text.end(), isIdentifierCharacter)) {
            add(path, "must be an identifier: letters, digits and hyphens, not beginning with a hyphen",
                "send the identifier that reading returned");
        }
        length(text, path);
    }

    void statement(const std::string& text, const std::string& path) {
        if (text.find('"') != std::string::npos) {
            add(path, "must not hold a double quote: it would end the text within the database statement",
                "leave the double quote out, or write another kind of quote");
        }
        withoutNul(text, path);
        length(text, path);
    }

    void argument(const std::string& text, const std::string& path) {
        if (text.starts_with('-')) {
            add(path, "must not begin with a hyphen: the tool would read it as an option",
                "write it without the hyphen");
        }
        withoutNul(text, path);
        length(text, path);
    }

    void absolutePath(const std::string& text, const std::string& path) {
        if (!text.starts_with('/')) {
            add(path, "must be an absolute path: the service and its tools do not share a current directory",
                "begin it with a slash");
        }
        withoutNul(text, path);
    }

    /// The database tool prints values unchanged: a value that spells out a whole row would be read as that row.
    void notARow(const std::string& text, const EntryDescription& entry, const std::string& path) {
        std::size_t width = 5;
        for (const std::string_view column : entry.columns) {
            width = std::max(width, column.size());
        }
        const std::string lines = '\n' + text;
        const bool spellsRow = !entry.columns.empty() &&
                               std::all_of(entry.columns.begin(), entry.columns.end(), [&](std::string_view column) {
                                   return lines.find('\n' + std::string(width - column.size(), ' ') +
                                                     std::string(column) + " = ") != std::string::npos;
                               });
        if (spellsRow) {
            add(path, "must not hold a line for each column as the database tool prints them",
                "change one of these lines; one more blank is enough");
        }
    }

    void notAColumn(const std::string& text, const EntryDescription& entry, const std::string& path) {
        const auto same = [&](std::string_view name) { return equalWithoutCase(name, text); };
        if (std::any_of(entry.columns.begin(), entry.columns.end(), same) ||
            std::any_of(rowNames.begin(), rowNames.end(), same)) {
            add(path, "must not be the name of a column of its table: the database would read the column instead",
                "choose another text; one more character is enough");
        }
    }

    void withoutNul(const std::string& text, const std::string& path) {
        if (text.find('\0') != std::string::npos) {
            add(path, "must not hold a NUL: no argument of a tool can carry it", "leave the NUL out");
        }
    }

    void length(const std::string& text, const std::string& path) {
        if (text.size() > maximumText) {
            add(path, "must not be longer than 95 kB: no argument of a tool could carry it", "send a shorter text");
        }
    }

    /// Texts that are short enough each, but not within one statement.
    void together(const Dictionary& values, const EntryDescription& entry, const std::string& path) {
        std::size_t sum = 0;
        std::string names;
        for (const std::string_view key : entry.together) {
            const std::string* text = values.get(key).string();
            const std::size_t size = text != nullptr ? text->size() : 0;
            if (size > maximumText) {
                return;  // found already
            }
            sum += size;
            names += (names.empty() ? "" : " and ") + std::string(key);
        }
        if (sum > maximumText) {
            add(path, names + " together must not be longer than 95 kB: they stand in one argument of a tool",
                "send shorter texts");
        }
    }

    void shortNames(const adminhost::Array& entries, const std::string& path) {
        std::size_t sum = 0;
        for (const Value& entry : entries) {
            const std::string* name =
                entry.dictionary() != nullptr ? entry.dictionary()->get("shortName").string() : nullptr;
            sum += name != nullptr && adminhost::booleanOf(entry.dictionary()->get("_newid_"))
                       ? name->size() + argumentCost
                       : 0;
        }
        if (sum > maximumArguments) {
            add(path, "names more than the arguments of one tool can carry", "send the changes in several requests");
        }
    }

    void add(const std::string& path, std::string rule, std::string advice) {
        _findings.push_back({path, std::move(rule), std::move(advice)});
    }

    std::vector<Finding>& _findings;
};

}  // namespace

std::vector<Finding> checkRequest(std::string_view command, const Dictionary& request) {
    std::vector<Finding> findings;
    if (const CommandDescription* description = findCommand(command)) {
        Check(findings).dictionary(request, description->keys, nullptr, {});
    }
    return findings;
}

std::vector<std::string> unknownKeys(std::string_view command, const Dictionary& request) {
    constexpr std::string_view configuration = "configuration";
    std::vector<std::string> paths;
    const CommandDescription* description = findCommand(command);
    const Value* given = request.find(configuration);
    if (description == nullptr || given == nullptr) {
        return paths;
    }
    for (const KeyDescription& key : description->keys) {
        if (key.name == configuration) {
            UnknownKeys(paths).value(*given, key, std::string(configuration));
        }
    }
    return paths;
}

}  // namespace lumio
