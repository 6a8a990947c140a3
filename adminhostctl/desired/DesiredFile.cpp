#include "adminhostctl/desired/DesiredFile.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/RequestArguments.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/Toml.h"

#include <algorithm>
#include <optional>
#include <set>

#include <fmt/format.h>
#include <toml++/toml.h>

namespace adminhost::ctl {
namespace {

constexpr std::string_view switchesTable = "remove_unlisted";

/// Text of a comment: one line.
std::string comment(const std::string& text) {
    return "# " + text + '\n';
}

std::string introduction(const StateForm& form) {
    std::string text =
        "# The desired state: \"adminhostctl plan FILE\" shows what would change, \"adminhostctl apply FILE\" changes "
        "it.\n"
        "# What is not listed stays as it is, unless a switch here says otherwise.\n"
        "\n";
    text += "[" + std::string(switchesTable) + "]\n";
    for (const std::string& name : form.switches()) {
        text += tomlKey(name) + " = false\n";
    }
    return text;
}

std::vector<std::string> labelsOf(const std::vector<Person>& people, std::string_view kind) {
    std::vector<std::string> labels;
    for (const Person& person : people) {
        if (person.kind == kind && !person.label.empty()) {
            labels.push_back(person.label);
        }
    }
    std::sort(labels.begin(), labels.end());
    labels.erase(std::unique(labels.begin(), labels.end()), labels.end());
    return labels;
}

std::string listText(const std::vector<std::string>& texts) {
    std::string list;
    for (const std::string& text : texts) {
        list += (list.empty() ? "" : ", ") + tomlText(text);
    }
    return '[' + list + ']';
}

/// The name of the element in a file: its label, or its identity if the label is not unique or is localized; nullopt if
/// neither can be used.
std::optional<std::string> nameOf(const State& state, const ListForm& list, const Element& element) {
    try {
        if (!list.localized && !element.label.empty() && findElement(state, list, element.label) == &element) {
            return element.label;
        }
    } catch (const Failure&) {
        // several have the label
    }
    // Two rows may have one identity; a file can name only the first.
    return list.byIdentity && findElement(state, list, element.identity) == &element ? std::optional(element.identity)
                                                                                     : std::nullopt;
}

void appendElement(std::string& text, const ListForm& list, const std::string& name, const Element& element) {
    text += "\n[" + tomlKey(list.section) + '.' + tomlKey(name) + "]\n";
    if (!element.label.empty() && name != element.label) {
        text += comment("name: " + tomlText(element.label));
    }
    for (std::size_t i = 0; element.label.empty() && i < element.otherNames.size(); ++i) {
        text += comment(list.otherNames[i] + ": " + tomlText(element.otherNames[i]));
    }
    for (const FieldForm& field : list.fields) {
        const Value& value = element.fields.get(field.key);
        if (isSecret(field, element)) {
            text += comment(tomlKey(field.inFile) + " = (secret)");
        } else if (const auto written = tomlValue(value)) {
            text += tomlKey(field.inFile) + " = " + *written + '\n';
        }
    }
    for (const PeopleForm& people : list.people) {
        for (const auto& [kind, inFile] : people.kinds) {
            text += tomlKey(inFile) + " = " + listText(labelsOf(element.people.at(people.key), kind)) + '\n';
        }
    }
}

void appendSection(std::string& text, const State& state, const ListForm& list) {
    std::vector<std::pair<std::string, const Element*>> sorted;
    for (const Element& element : elementsOf(state, list)) {
        sorted.emplace_back(nameOf(state, list, element).value_or(element.label), &element);
    }
    std::stable_sort(sorted.begin(), sorted.end(), [](const auto& a, const auto& b) { return a.first < b.first; });
    for (const auto& [name, element] : sorted) {
        if (nameOf(state, list, *element)) {
            appendElement(text, list, name, *element);
        } else {
            text += '\n' + comment(tomlKey(list.section) + '.' + tomlKey(name) + ", " + element->identity +
                                   ": not managed here, other elements may have this name");
        }
    }
}

/// A node with its line and column for messages.
class Node {
  public:
    Node(const std::string& from, std::string path, const toml::node& node)
        : _from(from), _path(std::move(path)), _node(node) {}

    [[noreturn]] void fail(const std::string& what) const {
        const toml::source_position place = _node.source().begin;
        throw usageError(fmt::format("{}, line {}, column {}: {} {}", _from, place.line, place.column, _path, what));
    }
    [[nodiscard]] std::vector<std::pair<std::string, Node>> entries() const {
        const toml::table* table = _node.as_table();
        if (table == nullptr) {
            fail("must be a table: [" + _path + "]");
        }
        std::vector<std::pair<std::string, Node>> all;
        for (const auto& [key, node] : *table) {
            all.emplace_back(std::string(key.str()),
                             Node(_from, (_path.empty() ? "" : _path + '.') + tomlKey(key.str()), node));
        }
        return all;
    }
    [[nodiscard]] bool flag() const {
        const auto value = _node.value_exact<bool>();
        return value ? *value : (fail("must be true or false"), false);
    }
    [[nodiscard]] std::string text() const {
        const auto value = _node.value_exact<std::string>();
        return value ? *value : (fail("must be a text in quotes"), std::string());
    }
    [[nodiscard]] std::vector<std::string> texts() const {
        const toml::array* array = _node.as_array();
        if (array == nullptr) {
            fail("must be a list of names: [\"anna\", \"ben\"]");
        }
        std::vector<std::string> all;
        for (const toml::node& element : *array) {
            all.push_back(Node(_from, "an entry of " + _path, element).text());
            if (all.back().empty()) {
                fail("is an empty name");
            }
        }
        return all;
    }
    [[nodiscard]] Value value() const {
        if (const auto text = _node.value_exact<std::string>()) {
            return *text;
        }
        if (const auto flag = _node.value_exact<bool>()) {
            return *flag;
        }
        if (const auto integer = _node.value_exact<std::int64_t>()) {
            return *integer;
        }
        if (const auto real = _node.value_exact<double>()) {
            return *real;
        }
        if (const auto date = _node.value_exact<toml::date_time>();
            date && date->offset && date->time.nanosecond == 0) {
            const std::chrono::sys_days day = std::chrono::year(date->date.year) / static_cast<int>(date->date.month) /
                                              static_cast<int>(date->date.day);
            return Date(day + std::chrono::hours(date->time.hour) + std::chrono::minutes(date->time.minute) +
                        std::chrono::seconds(date->time.second) - std::chrono::minutes(date->offset->minutes));
        }
        fail("must be a text, a number, true, false, or a date such as 2026-01-31T08:00:00Z");
    }

  private:
    const std::string& _from;
    std::string _path;
    const toml::node& _node;
};

/// Returns true if a setting can hold the value: it has the described type, or the type of the stored value.
bool fits(const DescribedKey& key, const Value& value, const Value& stored) {
    if (value.type() == stored.type()) {
        return true;
    }
    const std::string& type = key.enteredAs.empty() ? key.type : key.enteredAs;
    return type == "text"      ? value.string() != nullptr
           : type == "integer" ? value.isInteger()
           : type == "boolean" ? value.boolean().has_value()
           : type == "real"    ? value.real() || value.isInteger()
                               : true;
}

std::string joined(const std::vector<std::string>& words) {
    std::string text;
    for (std::size_t i = 0; i < words.size(); ++i) {
        text += (i == 0 ? "" : i + 1 < words.size() ? ", " : " and ") + words[i];
    }
    return text;
}

void parseSetting(Wanted& wanted, const std::string& key, const Node& node, const StateForm& form, const State& state,
                  bool force) {
    if (form.secret(key) != nullptr) {
        node.fail("is a secret, which a file must not hold; use --password-file FILE");
    }
    const DescribedKey* described = form.setting(key);
    if (described == nullptr) {
        node.fail("is not a setting that can be written; \"adminhostctl help " + form.command() +
                  "\" lists them below " + form.root());
    }
    Value value = node.value();
    const Value& stored = state.settings.get(key);
    if (!fits(*described, value, stored)) {
        const std::string& type = described->enteredAs.empty() ? described->type : described->enteredAs;
        node.fail("must be " + std::string(type == "integer"   ? "a whole number, without quotes"
                                           : type == "boolean" ? "true or false"
                                           : type == "real"    ? "a number"
                                                               : "a text in quotes"));
    }
    if (const std::string problem = rangeProblem(*described, value); !problem.empty() && !force && value != stored) {
        node.fail(problem + "; --force writes it nevertheless");
    }
    wanted.settings.set(key, std::move(value));
}

WantedElement parseElement(const ListForm& list, const std::string& name, const Node& table) {
    WantedElement element{name, {}, {}, {}, false, false};
    std::vector<std::string> known;
    for (const FieldForm& field : list.fields) {
        known.push_back(field.inFile);
    }
    for (const PeopleForm& people : list.people) {
        for (const auto& [kind, inFile] : people.kinds) {
            known.push_back(inFile);
        }
    }
    for (const auto& [key, node] : table.entries()) {
        const FieldForm* field = list.fieldInFile(key);
        if (field != nullptr) {
            element.fields.set(field->key, field->boolean ? Value(node.flag()) : Value(node.text()));
        } else if (std::find(known.begin(), known.end(), key) != known.end()) {
            element.lists[key] = node.texts();
        } else {
            node.fail("is unknown; the keys here are " + joined(known));
        }
    }
    return element;
}

void parseSwitch(Wanted& wanted, const std::string& key, const Node& node, const StateForm& form) {
    const std::vector<std::string> switches = form.switches();
    if (std::find(switches.begin(), switches.end(), key) == switches.end()) {
        node.fail("is unknown; the switches are " + joined(switches));
    }
    if (node.flag()) {
        wanted.removeUnlisted.insert(key);
    }
}

void parseSection(Wanted& wanted, const ListForm& list, const Node& table, const State& state) {
    std::set<const Element*> present;
    for (const auto& [name, node] : table.entries()) {
        wanted.elements[list.section].push_back(parseElement(list, name, node));
        const Element* element = findElement(state, list, name);
        if (element == nullptr && list.addedBy.empty()) {
            node.fail(list.localized ? "not found in the service; a file names " + list.section +
                                           " by their identities, which \"adminhostctl export\" lists"
                                     : "not found in the service; \"adminhostctl export\" lists the names");
        }
        if (element != nullptr && !present.insert(element).second) {
            node.fail("is in the file twice, by its name and by its identity");
        }
    }
}

toml::table parsed(std::string_view text, const std::string& from) {
    try {
        return toml::parse(text, from);
    } catch (const toml::parse_error& error) {
        const toml::source_position place = error.source().begin;
        throw usageError(
            fmt::format("{}, line {}, column {}: {}", from, place.line, place.column, shown(error.description())));
    }
}

}  // namespace

std::string exportOf(const StateForm& form, const State& state) {
    std::string text = introduction(form);
    text += "\n[" + tomlKey(form.settingsSection()) + "]\n";
    for (const DescribedKey& key : form.settings()) {
        const std::string name = form.nameOf(key);
        const Value& value = state.settings.get(name);
        if (value.isNull()) {
            continue;
        }
        const auto written = tomlValue(value);
        text +=
            written
                ? tomlKey(name) + " = " + *written + '\n'
                : comment(tomlKey(name) + ": a " + std::string(adminhost::nameOf(value.type())) + ", not managed here");
    }
    for (const ListForm& list : form.lists()) {
        appendSection(text, state, list);
    }
    return text;
}

Wanted parseDesired(std::string_view text, const std::string& from, const StateForm& form, const State& state,
                    bool force) {
    const toml::table table = parsed(text, from);
    std::vector<std::string> known{form.settingsSection()};
    for (const ListForm& list : form.lists()) {
        known.push_back(list.section);
    }
    known.emplace_back(switchesTable);
    Wanted wanted;
    for (const auto& [section, content] : Node(from, "", table).entries()) {
        if (std::find(known.begin(), known.end(), section) == known.end()) {
            content.fail("is unknown; the tables are " + joined(known));
        }
        if (section != form.settingsSection() && section != switchesTable) {
            parseSection(wanted, form.list(section), content, state);
            continue;
        }
        for (const auto& [key, node] : content.entries()) {
            if (section == switchesTable) {
                parseSwitch(wanted, key, node, form);
            } else {
                parseSetting(wanted, key, node, form, state, force);
            }
        }
    }
    return wanted;
}

}  // namespace adminhost::ctl
