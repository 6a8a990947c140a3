#include "adminhostctl/desired/State.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/desired/Toml.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cctype>

namespace adminhost::ctl {
namespace {

std::string textAt(const Dictionary& dictionary, std::string_view key) {
    const Value& value = dictionary.get(key);
    return value.isNull() ? std::string() : textOf(value);
}

ListedCamera cameraOf(const Dictionary& listed) {
    ListedCamera camera{
        textAt(listed, "_id_"), textAt(listed, "name"), booleanOf(listed.get("access_control_enabled")), {}};
    const Array* allowed = listed.get("allowedUsersAndGroups").array();
    for (const Value& entry : allowed != nullptr ? *allowed : Array{}) {
        if (const Dictionary* person = entry.dictionary()) {
            camera.allowed.push_back({textAt(*person, "type"), textAt(*person, "shortName"), textAt(*person, "_id_")});
        }
    }
    return camera;
}

ListedProperty propertyOf(const Dictionary& listed) {
    ListedProperty property{textAt(listed, "_id_"), textAt(listed, "name"), std::nullopt,
                            booleanOf(listed.get("protect"))};
    if (listed.contains("value") && !property.isProtected) {
        property.value = textAt(listed, "value");
    }
    return property;
}

template <typename Element>
std::optional<std::vector<Element>> listOf(const Value& list, Element (*make)(const Dictionary&)) {
    if (list.array() == nullptr) {
        return std::nullopt;
    }
    std::vector<Element> all;
    for (const Value& element : *list.array()) {
        if (element.dictionary() != nullptr && !textAt(*element.dictionary(), "_id_").empty()) {
            all.push_back(make(*element.dictionary()));
        }
    }
    return all;
}

Failure notListed(const std::string& what) {
    return {ExitStatus::answeredError, "the service answered no " + what + ": its database cannot be read"};
}

}  // namespace

State stateOf(const Dictionary& configuration) {
    State state;
    for (const DictionaryEntry& entry : configuration) {
        if (entry.key != "cameras" && entry.key != "workflows" && entry.key != "properties") {
            state.settings.set(entry.key, entry.value);
        }
    }
    state.properties = listOf<ListedProperty>(configuration.get("properties"), &propertyOf);
    state.cameras = listOf<ListedCamera>(configuration.get("cameras"), &cameraOf);
    return state;
}

bool sameUuid(const std::string& a, const std::string& b) {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                      [](unsigned char x, unsigned char y) { return std::tolower(x) == std::tolower(y); });
}

const ListedCamera* findCamera(const State& state, const std::string& nameOrUuid) {
    if (!state.cameras) {
        throw notListed("cameras");
    }
    const ListedCamera* named = nullptr;
    std::string uuids;
    int count = 0;
    for (const ListedCamera& camera : *state.cameras) {
        if (sameUuid(camera.uuid, nameOrUuid)) {
            return &camera;
        }
        if (camera.name == nameOrUuid) {
            named = &camera;
            uuids += "\n  " + camera.uuid;
            ++count;
        }
    }
    if (count > 1) {
        throw usageError("several cameras have the name " + tomlText(nameOrUuid) +
                         "; give one of their UUIDs:" + uuids);
    }
    return named;
}

const ListedProperty* findProperty(const State& state, const std::string& name) {
    if (!state.properties) {
        throw notListed("properties");
    }
    const ListedProperty* found = nullptr;
    for (const ListedProperty& property : *state.properties) {
        if (property.name == name && found != nullptr) {
            throw usageError("several properties have the name " + tomlText(name) +
                             "; remove one with writeSettings and its _id_");
        }
        found = property.name == name ? &property : found;
    }
    return found;
}

}  // namespace adminhost::ctl
