#include "adminhostctl/desired/DesiredFile.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/RequestArguments.h"
#include "adminhostctl/SecretFile.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/Toml.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <filesystem>
#include <optional>
#include <set>

#include <fmt/format.h>
#include <toml++/toml.h>

namespace adminhost::ctl {

/// A node with its line and column for messages.
class FileNode {
  public:
    FileNode(const std::string& from, std::string path, const toml::node& node)
        : _from(from), _path(std::move(path)), _node(node) {}

    /// "host.toml, line 2, column 15".
    [[nodiscard]] std::string place() const {
        const toml::source_position begin = _node.source().begin;
        return fmt::format("{}, line {}, column {}", _from, begin.line, begin.column);
    }
    [[noreturn]] void fail(const std::string& what) const {
        throw usageError(fmt::format("{}: {} {}", place(), _path, what));
    }
    [[nodiscard]] std::vector<std::pair<std::string, FileNode>> entries() const {
        const toml::table* table = _node.as_table();
        if (table == nullptr) {
            fail("must be a table: [" + _path + "]");
        }
        std::vector<std::pair<std::string, FileNode>> all;
        for (const auto& [key, node] : *table) {
            all.emplace_back(std::string(key.str()),
                             FileNode(_from, (_path.empty() ? "" : _path + '.') + tomlKey(key.str()), node));
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
    /// The names of a list, each with its place.
    [[nodiscard]] std::vector<std::pair<std::string, std::string>> names() const {
        const toml::array* array = _node.as_array();
        if (array == nullptr) {
            fail("must be a list of names: [\"anna\", \"ben\"]");
        }
        std::vector<std::pair<std::string, std::string>> all;
        for (const toml::node& element : *array) {
            const FileNode entry(_from, "an entry of " + _path, element);
            all.emplace_back(entry.text(), entry.place());
            if (all.back().first.empty()) {
                fail("is an empty name");
            }
        }
        return all;
    }
    /// The secret in the file that the text names, which is relative to the directory of this file.
    [[nodiscard]] std::string secret() const {
        const std::filesystem::path directory = std::filesystem::path(_from == "-" ? "" : _from).parent_path();
        auto secret = secretOfFile((directory / text()).string());
        return secret ? *std::move(secret)
                      : (fail("cannot be used: " + textOf(secret.error().description)), std::string());
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

namespace {

constexpr std::string_view fileSuffix = "_file";  ///< of the key that names the file with a text

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

Value settingOf(const std::string& key, const FileNode& node, const StateForm& form, const State& state, bool force) {
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
    return value;
}

/// The text field that the key of a file with a secret stands for; null for another key.
const FieldForm* fieldOfFile(const ListForm& list, std::string_view key) {
    if (!key.ends_with(fileSuffix)) {
        return nullptr;
    }
    const FieldForm* field = list.fieldInFile(key.substr(0, key.size() - fileSuffix.size()));
    return field == nullptr || field->secretIf.empty() ? nullptr : field;
}

std::vector<std::string> keysOf(const ListForm& list) {
    std::vector<std::string> known;
    for (const FieldForm& field : list.fields) {
        known.push_back(field.inFile);
        if (!field.secretIf.empty()) {
            known.push_back(field.inFile + std::string(fileSuffix));
        }
    }
    for (const PeopleForm& people : list.people) {
        for (const auto& [kind, inFile] : people.kinds) {
            known.push_back(inFile);
        }
    }
    return known;
}

/// Adds the keys of the table to the element, in place of those that an earlier file has given.
void readElement(WantedElement& element, const ListForm& list, const FileNode& table) {
    element.place = table.place();
    std::set<const FieldForm*> given;
    for (const auto& [key, node] : table.entries()) {
        const FieldForm* const field = list.fieldInFile(key);
        const FieldForm* const ofFile = field == nullptr ? fieldOfFile(list, key) : nullptr;
        if (field != nullptr || ofFile != nullptr) {
            const FieldForm& text = field != nullptr ? *field : *ofFile;
            if (!given.insert(&text).second) {
                node.fail("is the same as " + text.inFile + ", of which only one can be given");
            }
            element.fields.set(text.key, text.boolean        ? Value(node.flag())
                                         : ofFile != nullptr ? Value(node.secret())
                                                             : Value(node.text()));
        } else if (list.isPeople(key)) {
            element.lists[key].clear();
            element.places[key].clear();
            for (auto& [name, place] : node.names()) {
                element.lists[key].push_back(std::move(name));
                element.places[key].push_back(std::move(place));
            }
        } else {
            node.fail("is unknown; the keys here are " + joined(keysOf(list)));
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

DesiredFiles::DesiredFiles(const StateForm& form, const State& state, Options options)
    : _form(form), _state(state), _options(std::move(options)) {
    _wanted.only = _options.only;
}

bool DesiredFiles::isChosen(const std::string& section) const {
    return _options.only.empty() || _options.only.contains(section);
}

void DesiredFiles::add(std::string_view text, const std::string& from) {
    const toml::table table = parsed(text, from);
    std::vector<std::string> known{_form.settingsSection()};
    for (const ListForm& list : _form.lists()) {
        known.push_back(list.section);
    }
    known.emplace_back(switchesTable);
    for (const auto& [section, content] : FileNode(from, "", table).entries()) {
        if (std::find(known.begin(), known.end(), section) == known.end()) {
            content.fail("is unknown; the tables are " + joined(known));
        }
        if (section == switchesTable) {
            for (const auto& [key, node] : content.entries()) {
                addSwitch(key, node);
            }
        } else if (!isChosen(section)) {
            continue;
        } else if (section == _form.settingsSection()) {
            for (const auto& [key, node] : content.entries()) {
                _wanted.settings.set(key, settingOf(key, node, _form, _state, _options.force));
            }
        } else {
            addElements(_form.list(section), content);
        }
    }
}

void DesiredFiles::addSwitch(const std::string& key, const FileNode& node) {
    const std::vector<std::string> switches = _form.switches();
    if (std::find(switches.begin(), switches.end(), key) == switches.end()) {
        node.fail("is unknown; the switches are " + joined(switches));
    }
    if (node.flag()) {
        _wanted.removeUnlisted.insert(key);
    } else {
        _wanted.removeUnlisted.erase(key);
    }
}

void DesiredFiles::addElements(const ListForm& list, const FileNode& table) {
    std::vector<WantedElement>& elements = _wanted.elements[list.section];
    std::set<const Element*> present;
    for (const auto& [name, node] : table.entries()) {
        const Element* element = findElement(_state, list, name);
        if (element == nullptr && list.addedBy.empty()) {
            node.fail(list.localized ? "not found in the service; a file names " + list.section +
                                           " by their identities, which \"adminhostctl export\" lists"
                                     : "not found in the service; \"adminhostctl export\" lists the names");
        }
        if (element != nullptr && !present.insert(element).second) {
            node.fail("is in the file twice, by its name and by its identity");
        }
        // An earlier file may name it in the other way.
        auto found = std::find_if(elements.begin(), elements.end(), [&, &wanted = name](const WantedElement& one) {
            return one.name == wanted || (element != nullptr && findElement(_state, list, one.name) == element);
        });
        if (found == elements.end()) {
            found = elements.insert(found, WantedElement{name, {}, {}, {}, false, false});
        }
        readElement(*found, list, node);
    }
}

Wanted parseDesired(std::string_view text, const std::string& from, const StateForm& form, const State& state,
                    bool force) {
    DesiredFiles files(form, state, {.force = force});
    files.add(text, from);
    return files.wanted();
}

}  // namespace adminhost::ctl
