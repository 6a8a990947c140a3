#include "adminhostctl/desired/DesiredFile.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/Toml.h"
#include "adminhostctl/desired/Writing.h"

#include <algorithm>
#include <set>

#include <fmt/format.h>
#include <toml++/toml.h>

namespace adminhost::ctl {
namespace {

constexpr std::string_view introduction =
    "# The desired state: \"adminhostctl plan FILE\" shows what would change, \"adminhostctl apply FILE\" changes it.\n"
    "# What is not listed stays as it is, unless a switch here says otherwise.\n"
    "\n"
    "[remove_unlisted]\n"
    "properties = false\n"
    "access = false\n";

/// Text of a comment: one line.
std::string comment(const std::string& text) {
    return "# " + text + '\n';
}

std::vector<std::string> namesOf(const ListedCamera& camera, std::string_view kind) {
    std::vector<std::string> names;
    for (const ListedPerson& person : camera.allowed) {
        if (person.kind == kind && !person.shortName.empty()) {
            names.push_back(person.shortName);
        }
    }
    std::sort(names.begin(), names.end());
    names.erase(std::unique(names.begin(), names.end()), names.end());
    return names;
}

std::string listText(const std::vector<std::string>& texts) {
    std::string list;
    for (const std::string& text : texts) {
        list += (list.empty() ? "" : ", ") + tomlText(text);
    }
    return '[' + list + ']';
}

void appendProperties(std::string& text, const std::vector<ListedProperty>& all) {
    std::vector<const ListedProperty*> sorted;
    std::multiset<std::string> names;
    for (const ListedProperty& property : all) {
        sorted.push_back(&property);
        names.insert(property.name);
    }
    std::stable_sort(sorted.begin(), sorted.end(),
                     [](const ListedProperty* a, const ListedProperty* b) { return a->name < b->name; });
    for (const ListedProperty* property : sorted) {
        text += '\n';
        if (property->name.empty() || names.count(property->name) > 1) {
            text += comment("properties." + tomlKey(property->name) + ", row " + property->id +
                            ": not managed here, its name does not stand for it alone");
            continue;
        }
        text += "[properties." + tomlKey(property->name) + "]\n";
        text += property->value         ? "value = " + tomlText(*property->value) + '\n'
                : property->isProtected ? comment("value = (secret)")
                                        : std::string();
        text += std::string("protect = ") + (property->isProtected ? "true" : "false") + '\n';
    }
}

/// The name, or the UUID where the name does not find this camera alone.
std::string keyOf(const State& state, const ListedCamera& camera) {
    try {
        return !camera.name.empty() && findCamera(state, camera.name) == &camera ? camera.name : camera.uuid;
    } catch (const Failure&) {
        return camera.uuid;
    }
}

void appendCameras(std::string& text, const State& state) {
    std::vector<std::pair<std::string, const ListedCamera*>> sorted;
    for (const ListedCamera& camera : *state.cameras) {
        sorted.emplace_back(keyOf(state, camera), &camera);
    }
    std::sort(sorted.begin(), sorted.end());
    for (const auto& [key, camera] : sorted) {
        text += "\n[cameras." + tomlKey(key) + "]\n";
        if (key != camera->name) {
            text += comment("name: " + tomlText(camera->name));
        }
        text += std::string("access_control = ") + (camera->restricted ? "true" : "false") + '\n';
        text += "users = " + listText(namesOf(*camera, "user")) + '\n';
        text += "groups = " + listText(namesOf(*camera, "group")) + '\n';
    }
}

/// A node with its place for messages.
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
            fail("is a table: [" + _path + "]");
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
        return value ? *value : (fail("takes true or false"), false);
    }
    [[nodiscard]] std::string text() const {
        const auto value = _node.value_exact<std::string>();
        return value ? *value : (fail("takes a text in quotes"), std::string());
    }
    [[nodiscard]] std::vector<std::string> texts() const {
        const toml::array* array = _node.as_array();
        if (array == nullptr) {
            fail("takes a list of short names: [\"anna\", \"ben\"]");
        }
        std::vector<std::string> all;
        for (const toml::node& element : *array) {
            all.push_back(Node(_from, "an entry of " + _path, element).text());
            if (all.back().empty()) {
                fail("has an empty short name");
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
        fail("takes a text, a number, true, false, or a date such as 2026-01-31T08:00:00Z");
    }

  private:
    const std::string& _from;
    std::string _path;
    const toml::node& _node;
};

/// Whether a setting can hold the value: of the described type, or of the type that is stored.
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

void parseSetting(Wanted& wanted, const std::string& key, const Node& node, const Description& writeSettings,
                  const State& state) {
    if (key == passwordKey) {
        node.fail("is secret and stands in no file: give it with --password-file FILE");
    }
    const DescribedKey* described = settingKey(writeSettings, key);
    if (described == nullptr) {
        node.fail(
            "is no setting that can be written; \"adminhostctl help writeSettings\" lists them below configuration");
    }
    Value value = node.value();
    const Value& stored = state.settings.get(key);
    if (!fits(*described, value, stored)) {
        const std::string& type = described->enteredAs.empty() ? described->type : described->enteredAs;
        node.fail("takes " + std::string(type == "integer"   ? "a whole number, without quotes"
                                         : type == "boolean" ? "true or false"
                                         : type == "real"    ? "a number"
                                                             : "a text in quotes"));
    }
    wanted.settings.set(key, std::move(value));
}

WantedProperty parseProperty(const std::string& name, const Node& table) {
    WantedProperty property{name, {}, {}, false, false};
    for (const auto& [key, node] : table.entries()) {
        if (key == "value") {
            property.value = node.text();
        } else if (key == "protect") {
            property.isProtected = node.flag();
        } else {
            node.fail("is unknown; a property has value and protect");
        }
    }
    return property;
}

WantedCamera parseCamera(const std::string& name, const Node& table) {
    WantedCamera camera{name, {}, {}, {}, {}, false};
    for (const auto& [key, node] : table.entries()) {
        if (key == "access_control") {
            camera.restricted = node.flag();
        } else if (key == "users") {
            camera.users = node.texts();
        } else if (key == "groups") {
            camera.groups = node.texts();
        } else {
            node.fail("is unknown; a camera has access_control, users and groups");
        }
    }
    return camera;
}

void parseSwitch(Wanted& wanted, const std::string& key, const Node& node) {
    if (key == "properties") {
        wanted.removeProperties = node.flag();
    } else if (key == "access") {
        wanted.removePeople = node.flag();
    } else {
        node.fail("is unknown; remove_unlisted has properties and access");
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

std::string exportOf(const State& state, const Description& writeSettings) {
    std::string text(introduction);
    text += "\n[settings]\n";
    constexpr std::string_view prefix = "configuration.";
    for (const DescribedKey& key : writeSettings.keys()) {
        const std::string name = key.path.starts_with(prefix) ? key.path.substr(prefix.size()) : std::string();
        const Value& value = state.settings.get(name);
        if (name.empty() || value.isNull() || settingKey(writeSettings, name) == nullptr) {
            continue;
        }
        const auto written = tomlValue(value);
        text += written ? tomlKey(name) + " = " + *written + '\n'
                        : comment(tomlKey(name) + ": a " + std::string(nameOf(value.type())) + ", not managed here");
    }
    if (state.properties) {
        appendProperties(text, *state.properties);
    }
    if (state.cameras) {
        appendCameras(text, state);
    }
    return text;
}

Wanted parseDesired(std::string_view text, const std::string& from, const Description& writeSettings,
                    const State& state) {
    const toml::table table = parsed(text, from);
    Wanted wanted;
    std::set<const ListedCamera*> cameras;
    for (const auto& [section, content] : Node(from, "", table).entries()) {
        for (const auto& [key, node] :
             section == "settings" || section == "properties" || section == "cameras" || section == "remove_unlisted"
                 ? content.entries()
                 : (content.fail("is unknown; there are settings, properties, cameras and "
                                 "remove_unlisted"),
                    std::vector<std::pair<std::string, Node>>())) {
            if (section == "settings") {
                parseSetting(wanted, key, node, writeSettings, state);
            } else if (section == "remove_unlisted") {
                parseSwitch(wanted, key, node);
            } else if (section == "properties") {
                wanted.properties.push_back(parseProperty(key, node));
            } else {
                wanted.cameras.push_back(parseCamera(key, node));
                const ListedCamera* camera = findCamera(state, key);
                if (camera == nullptr) {
                    node.fail("is no camera of the service; \"adminhostctl camera list\" shows their names");
                }
                if (!cameras.insert(camera).second) {
                    node.fail("is a camera that stands in the file twice, by name and by UUID");
                }
            }
        }
    }
    return wanted;
}

}  // namespace adminhost::ctl
