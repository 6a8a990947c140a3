#include "adminhostctl/lumio/Listing.h"

#include "adminhostctl/Age.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/lumio/People.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cctype>
#include <compare>
#include <map>

#include <fnmatch.h>

namespace adminhost::ctl {
namespace {

constexpr const char* listKey = "allowedUsersAndGroups";
constexpr const char* restrictedKey = "access_control_enabled";
constexpr std::size_t longList = 3;  ///< a longer one is shown as numbers
constexpr std::size_t unlimitedWidth = 100'000;

bool matches(const std::string& pattern, std::string_view text) {
    return ::fnmatch(pattern.c_str(), std::string(text).c_str(), FNM_CASEFOLD) == 0;
}

bool isSameWord(std::string_view a, std::string_view b) {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](unsigned char x, unsigned char y) {
        return std::tolower(x == '_' ? ' ' : x) == std::tolower(y == '_' ? ' ' : y);
    });
}

/// The key of the elements that a person names by its heading or by itself. Throws Failure(usage).
std::string keyOfColumn(const ElementKind& kind, const Description& listing, const std::string& name) {
    const std::string prefix = std::string(kind.section) + "[].";
    std::vector<std::string> known;
    std::string list;
    for (const DescribedKey& key : listing.answerKeys()) {
        if (!key.path.starts_with(prefix) || key.path.find_first_of(".[", prefix.size()) != std::string::npos) {
            continue;
        }
        std::string own = key.path.substr(prefix.size());
        if (isSameWord(name, own) || (!key.column.empty() && isSameWord(name, key.column))) {
            return own;
        }
        known.push_back(key.column.empty() ? own : key.column);
        list += (list.empty() ? "" : ", ") + known.back();
    }
    throw usageError("column not found: " + name + didYouMean(name, known) + "; the columns are " + list);
}

std::vector<std::string> keysOfColumns(const Context& context, const ElementKind& kind, const Description& listing) {
    std::vector<std::string> keys;
    std::string names = context.options.argumentOf(columnsOption);
    while (!names.empty()) {
        const std::size_t comma = std::min(names.find(','), names.size());
        keys.push_back(keyOfColumn(kind, listing, names.substr(0, comma)));
        names.erase(0, comma + 1);
    }
    if (keys.empty() && context.options.has(columnsOption)) {
        throw usageError("--columns: the list of columns is empty");
    }
    return keys;
}

/// A date that was never set is an empty text.
bool isMissing(const Value& value) {
    return value.isNull() || (value.string() != nullptr && value.string()->empty());
}

/// Numbers and dates by size, everything else by its text; values that are missing come last.
bool isBefore(const Value& a, const Value& b) {
    if (isMissing(a) || isMissing(b)) {
        return !isMissing(a) && isMissing(b);
    }
    if (const auto x = a.date(), y = b.date(); x && y) {
        return *x < *y;
    }
    if (const auto x = a.integer(), y = b.integer(); x && y) {
        return *x < *y;
    }
    return textOf(a) < textOf(b);
}

/// UUIDs of the person or group, and of the groups of the person.
std::vector<std::string> identitiesOf(const Context& context, const std::string& name) {
    const std::vector<Dictionary> entries = entriesNamed(context, name);
    if (entries.empty()) {
        throw unknownName(context, "person or group", name);
    }
    std::vector<std::string> identities;
    for (const Dictionary& entry : entries) {
        if (entry.text("type") == "user" && entry.get("groups").array() == nullptr) {
            throw Failure(ExitStatus::failed,
                          "the directory node " + std::string(entry.text("node")) +
                              " does not list the groups of people, so access through them is unknown");
        }
        identities.emplace_back(entry.text("_id_"));
        for (const Dictionary& group : dictionariesOf(entry.get("groups"))) {
            identities.emplace_back(group.text("_id_"));
        }
    }
    return identities;
}

bool isAllowed(const Dictionary& element, const std::vector<std::string>& identities) {
    if (element.get(restrictedKey) != Value(true)) {
        return true;
    }
    const std::vector<Dictionary> people = dictionariesOf(element.get(listKey));
    return std::any_of(people.begin(), people.end(), [&](const Dictionary& person) {
        return std::any_of(identities.begin(), identities.end(),
                           [&](const std::string& one) { return isSameUuid(person.text("_id_"), one); });
    });
}

/// "12 people, 3 groups".
std::string countsOf(const std::vector<Dictionary>& people) {
    const auto groups = static_cast<std::size_t>(std::count_if(
        people.begin(), people.end(), [](const Dictionary& person) { return person.text("type") == "group"; }));
    const std::size_t persons = people.size() - groups;
    std::string text = persons == 0 ? "" : std::to_string(persons) + (persons == 1 ? " person" : " people");
    if (groups > 0) {
        text += (text.empty() ? "" : ", ") + std::to_string(groups) + (groups == 1 ? " group" : " groups");
    }
    return text;
}

/// The element as a row for people.
Dictionary rowOf(const Dictionary& element, bool wide) {
    Dictionary row = element;
    const std::vector<Dictionary> people = dictionariesOf(element.get(listKey));
    if (element.contains(listKey) && element.get(restrictedKey) == Value(false)) {
        row.set(listKey, "everyone");
    } else if (people.size() > longList && !wide) {
        row.set(listKey, countsOf(people));
    }
    return row;
}

}  // namespace

Array chosenElements(const Context& context, const ElementKind& kind, const Description& listing,
                     const Array& elements) {
    const VerbOptions& options = context.options;
    const std::string sortKey =
        options.has(sortOption) ? keyOfColumn(kind, listing, options.argumentOf(sortOption)) : std::string();
    const std::vector<std::string> identities = options.has(allowedOption)
                                                    ? identitiesOf(context, options.argumentOf(allowedOption))
                                                    : std::vector<std::string>();
    Array chosen;
    for (const Value& value : elements) {
        const Dictionary* element = value.dictionary();
        if (element == nullptr) {
            continue;
        }
        const bool isChosen =
            (!options.has(matchOption) || matches(options.argumentOf(matchOption), element->text("name"))) &&
            (!options.has(statusOption) ||
             matches(options.argumentOf(statusOption), element->text("recording_status"))) &&
            (!options.has(restrictedOption) || element->get(restrictedKey) == Value(true)) &&
            (!options.has(allowedOption) || isAllowed(*element, identities));
        if (isChosen) {
            chosen.push_back(value);
        }
    }
    if (!sortKey.empty()) {
        std::stable_sort(chosen.begin(), chosen.end(), [&](const Value& a, const Value& b) {
            return isBefore(a.dictionary()->get(sortKey), b.dictionary()->get(sortKey));
        });
    }
    return chosen;
}

void writeElements(const Context& context, const ElementKind& kind, const Description& listing, const Array& elements) {
    const std::vector<std::string> columns = keysOfColumns(context, kind, listing);
    Array rows;
    for (const Value& element : elements) {
        if (context.options.format == Format::text) {
            rows.emplace_back(rowOf(*element.dictionary(), context.options.has(wideOption)));
            continue;
        }
        Dictionary row;
        for (const std::string& key : columns) {
            if (const Value* value = element.dictionary()->find(key)) {
                row.set(key, *value);
            }
        }
        rows.push_back(columns.empty() ? element : Value(std::move(row)));
    }
    if (context.options.format != Format::text) {
        writeValue(context, rows, listing, kind.section);
        return;
    }
    const std::size_t width = context.options.has(wideOption) ? unlimitedWidth : context.options.width;
    context.out << Reading(listing, width, columns).text(rows, kind.section);
}

void writeElement(const Context& context, const ElementKind& kind, const Description& listing,
                  const Dictionary& element) {
    Dictionary row = element;
    if (context.options.format == Format::text) {
        if (row.get("_id_") == row.get("uuid") || row.get("_id_") == row.get("id")) {
            row.remove("_id_");
        }
        std::map<std::string, std::string> names;  // the same person often did everything
        for (const DictionaryEntry& entry : element) {
            const std::string* text = entry.value.string();
            if (entry.key.ends_with("_user_uuid") && text != nullptr && !text->empty()) {
                if (!names.contains(*text)) {
                    const std::vector<Dictionary> people = entriesNamed(context, *text);
                    names[*text] = people.empty() ? *text + " (not in the directory)"
                                                  : std::string(people.front().text("longName"));
                }
                row.set(entry.key, names[*text]);
            } else if (const auto date = entry.value.date()) {
                row.set(entry.key, dateWithAge(*date, std::chrono::system_clock::now()));
            }
        }
    }
    writeValue(context, row, listing, std::string(kind.section) + "[]");
}

}  // namespace adminhost::ctl
