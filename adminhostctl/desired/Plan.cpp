#include "adminhostctl/desired/Plan.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/desired/Toml.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <array>
#include <set>

namespace adminhost::ctl {
namespace {

constexpr std::string_view secret = "(secret)";
/// Where the other settings files lie: with one of these changed, they are other files.
constexpr std::array<std::string_view, 2> placeKeys = {"shared_filesystem", "member_uuid"};
constexpr std::array<std::string_view, 2> restartKeys = {"shared_filesystem", "nimbo_client_username"};

std::string valueText(const Value& value) {
    return value.isNull() ? "(not set)" : tomlValue(value).value_or("(" + std::string(nameOf(value.type())) + ")");
}
std::string flagText(bool flag) {
    return flag ? "true" : "false";
}

bool contains(std::span<const std::string_view> keys, std::string_view key) {
    return std::find(keys.begin(), keys.end(), key) != keys.end();
}

void planSettings(Plan& plan, const Wanted& wanted, const State& state) {
    bool moves = false;
    for (const DictionaryEntry& entry : wanted.settings) {
        const Value& stored = state.settings.get(entry.key);
        if (entry.value == stored) {
            continue;
        }
        if (entry.key == controllerKey && !wanted.lookUpController && entry.value.string() != nullptr &&
            isLookedUp(*entry.value.string())) {
            plan.notes.push_back("settings.nimbo_controller: " + valueText(entry.value) +
                                 " will be resolved by the write that sets it, so it is left as it is, " +
                                 valueText(stored) +
                                 "; use \"settings set nimbo_controller\", then put the name that it stored here");
            continue;
        }
        plan.changes.push_back({"settings." + entry.key, valueText(stored), valueText(entry.value)});
        plan.configuration.set(entry.key, entry.value);
        plan.restart = plan.restart || contains(restartKeys, entry.key);
        moves = moves || contains(placeKeys, entry.key);
    }
    if (moves) {
        // What is equal now need not be equal in the files that are used from then on.
        for (const DictionaryEntry& entry : wanted.settings) {
            if (entry.key != controllerKey) {
                plan.configuration.set(entry.key, entry.value);
            }
        }
    }
    if (wanted.password) {
        const bool isSet = booleanOf(state.settings.get("nimbo_client_password_is_set"));
        if (!wanted.password->empty() || isSet) {
            plan.changes.push_back({"settings." + std::string(passwordKey), isSet ? std::string(secret) : "(not set)",
                                    wanted.password->empty() ? "(not set)" : std::string(secret)});
            plan.configuration.set(passwordKey, *wanted.password);
        }
    }
}

void planNewProperty(Plan& plan, Array& records, const WantedProperty& wanted, const std::string& entry) {
    if (wanted.name.empty()) {
        throw usageError("a property needs a name");
    }
    if (!wanted.value) {
        throw usageError(entry + " does not exist yet, and a new property needs a value");
    }
    const bool isProtected = wanted.isProtected.value_or(false);
    Dictionary record{{"_newid_", true}, {"name", wanted.name}, {"value", *wanted.value}};
    if (isProtected) {
        record.set("protect", true);
    }
    records.emplace_back(std::move(record));
    plan.changes.push_back({entry, "(not there)", isProtected ? std::string(secret) : tomlText(*wanted.value)});
}

void planProperty(Plan& plan, Array& records, const WantedProperty& wanted, const State& state) {
    const std::string entry = "properties." + tomlKey(wanted.name);
    const ListedProperty* stored = findProperty(state, wanted.name);
    if (wanted.remove) {
        if (stored != nullptr) {
            records.emplace_back(Dictionary{{"_id_", stored->id}, {"_obsoleteid_", true}});
            plan.changes.push_back(
                {entry, stored->value ? tomlText(*stored->value) : std::string(secret), "(removed)"});
        }
        return;
    }
    if (stored == nullptr) {
        planNewProperty(plan, records, wanted, entry);
        return;
    }
    // The service takes "protect" as an order: sent without a change, it would protect what is protected already.
    const bool becomes = wanted.isProtected.value_or(stored->isProtected);
    const bool switches = becomes != stored->isProtected;
    bool writes = wanted.value && wanted.value != stored->value;
    if (writes && stored->isProtected && becomes && !wanted.writeSecret) {
        plan.notes.push_back(entry +
                             ".value: (secret), cannot be compared and is left as it is; \"property set\" writes it");
        writes = false;
    }
    if (!writes && !switches) {
        return;
    }
    Dictionary record{{"_id_", stored->id}};
    if (writes) {
        const auto text = [](bool hidden, const std::optional<std::string>& value) {
            return hidden ? std::string(secret) : value ? tomlText(*value) : "(not set)";
        };
        record.set("value", *wanted.value);
        plan.changes.push_back(
            {entry + ".value", text(stored->isProtected, stored->value), text(becomes, wanted.value)});
    }
    if (switches) {
        record.set("protect", becomes);
        plan.changes.push_back({entry + ".protect", flagText(stored->isProtected), flagText(becomes)});
    }
    records.emplace_back(std::move(record));
}

/// Properties that a file can name: unlisted ones are removed, the others left alone.
void planRemovals(Plan& plan, Array& records, const Wanted& wanted, const State& state) {
    std::set<std::string> listed;
    std::multiset<std::string> names;
    for (const WantedProperty& property : wanted.properties) {
        listed.insert(property.name);
    }
    for (const ListedProperty& property : state.properties.value_or(std::vector<ListedProperty>())) {
        names.insert(property.name);
    }
    for (const ListedProperty& property : state.properties.value_or(std::vector<ListedProperty>())) {
        if (!property.name.empty() && names.count(property.name) == 1 && listed.count(property.name) == 0) {
            planProperty(plan, records, {property.name, {}, {}, true, false}, state);
        }
    }
}

class AccessList {
  public:
    AccessList(Plan& plan, const ListedCamera& camera, std::string entry)
        : _plan(plan), _camera(camera), _entry(std::move(entry)) {}

    void allow(const std::string& kind, const std::vector<std::string>& names) {
        for (const std::string& name : names) {
            if (name.empty()) {
                throw usageError(_entry + ": a short name is empty");
            }
            const bool stands = std::any_of(
                _camera.allowed.begin(), _camera.allowed.end(),
                [&](const ListedPerson& person) { return person.kind == kind && person.shortName == name; });
            if (!stands && change(kind, name, true)) {
                _records.emplace_back(Dictionary{{"_newid_", true}, {"type", kind}, {"shortName", name}});
            }
        }
    }

    /// Takes away everyone of the kind that is not named. Who has no short name cannot be listed and stays.
    void keepOnly(const std::string& kind, const std::vector<std::string>& names) {
        for (const ListedPerson& person : _camera.allowed) {
            if (person.kind == kind && !person.shortName.empty() &&
                std::find(names.begin(), names.end(), person.shortName) == names.end()) {
                deny(person);
            }
        }
    }

    void deny(const ListedPerson& person) {
        if (change(person.kind, person.shortName, false)) {
            _records.emplace_back(Dictionary{{"_obsoleteid_", true}, {"_id_", person.id}});
        }
    }

    [[nodiscard]] Array& records() noexcept { return _records; }

  private:
    /// False when the change stands already.
    bool change(const std::string& kind, const std::string& name, bool allowed) {
        PlannedChange change{_entry + '.' + kind + "s." + tomlKey(name), allowed ? "(not allowed)" : "(allowed)",
                             allowed ? "(allowed)" : "(not allowed)"};
        if (std::find(_plan.changes.begin(), _plan.changes.end(), change) != _plan.changes.end()) {
            return false;
        }
        _plan.changes.push_back(std::move(change));
        return true;
    }

    Plan& _plan;
    const ListedCamera& _camera;
    std::string _entry;
    Array _records;
};

void planCamera(Plan& plan, Array& records, const WantedCamera& wanted, const State& state, bool removePeople) {
    const std::string entry = "cameras." + tomlKey(wanted.key);
    const ListedCamera* camera = findCamera(state, wanted.key);
    if (camera == nullptr) {
        throw usageError(entry + ": there is no such camera; \"adminhostctl camera list\" shows the names");
    }
    Dictionary record{{"_id_", camera->uuid}};
    if (wanted.remove) {
        record.set("_obsoleteid_", true);
        records.emplace_back(std::move(record));
        plan.changes.push_back({entry, "(there)", "(removed)"});
        return;
    }
    if (wanted.restricted && *wanted.restricted != camera->restricted) {
        record.set("access_control_enabled", *wanted.restricted);
        plan.changes.push_back({entry + ".access_control", flagText(camera->restricted), flagText(*wanted.restricted)});
    }
    AccessList list(plan, *camera, entry);
    for (const auto& [kind, names] : {std::pair{"user", &wanted.users}, std::pair{"group", &wanted.groups}}) {
        if (*names) {
            list.allow(kind, **names);
            if (removePeople) {
                list.keepOnly(kind, **names);
            }
        }
    }
    for (const ListedPerson& denied : wanted.denied) {
        for (const ListedPerson& person : camera->allowed) {
            if (person.shortName == denied.shortName && (denied.kind.empty() || denied.kind == person.kind)) {
                list.deny(person);
            }
        }
    }
    if (!list.records().empty()) {
        record.set("allowedUsersAndGroups", std::move(list.records()));
    }
    if (record.size() > 1) {
        records.emplace_back(std::move(record));
    }
}

bool logs(std::span<const std::string> log, std::initializer_list<std::string> texts) {
    return std::any_of(log.begin(), log.end(), [&](const std::string& line) {
        return std::any_of(texts.begin(), texts.end(),
                           [&](const std::string& text) { return line.find(text) != std::string::npos; });
    });
}

const PlannedChange* changeOf(const Plan& plan, const std::string& entry) {
    const auto found = std::find_if(plan.changes.begin(), plan.changes.end(),
                                    [&](const PlannedChange& change) { return change.entry == entry; });
    return found != plan.changes.end() ? &*found : nullptr;
}

/// What the service logs when it cannot protect a text or read a protected one.
bool cipherFailed(std::span<const std::string> log) {
    return logs(log, {"failed to load", "kek shared_secret not found", "no convertedValueData from"});
}

}  // namespace

bool isLookedUp(const std::string& controller) {
    if (controller.ends_with(".local")) {
        return controller.size() > std::string_view(".local").size();
    }
    return !controller.empty() && controller.find('.') == std::string::npos;
}

Plan planOf(const Wanted& wanted, const State& state) {
    Plan plan;
    planSettings(plan, wanted, state);
    Array properties;
    for (const WantedProperty& property : wanted.properties) {
        planProperty(plan, properties, property, state);
    }
    if (wanted.removeProperties) {
        planRemovals(plan, properties, wanted, state);
    }
    Array cameras;
    for (const WantedCamera& camera : wanted.cameras) {
        planCamera(plan, cameras, camera, state, wanted.removePeople);
    }
    if (!cameras.empty()) {
        plan.configuration.set("cameras", std::move(cameras));
    }
    if (!properties.empty()) {
        plan.configuration.set("properties", std::move(properties));
    }
    return plan;
}

std::vector<PlannedChange> changesNotTaken(const Wanted& wanted, const Plan& plan, const State& before,
                                           const State& after, bool settingsWritten, std::span<const std::string> log) {
    std::vector<PlannedChange> failed;
    Wanted visible = wanted;
    const auto addIf = [&](bool failedToTake, const std::string& entry) {
        if (const PlannedChange* change = failedToTake ? changeOf(plan, entry) : nullptr) {
            failed.push_back(*change);
        }
    };

    if (wanted.password) {
        const bool isSet = booleanOf(after.settings.get("nimbo_client_password_is_set"));
        addIf(!settingsWritten || isSet == wanted.password->empty() ||
                  logs(log, {"nimbo_client_password encryption failed"}),
              "settings." + std::string(passwordKey));
        visible.password.reset();
    }
    if (const std::string* controller = wanted.settings.get(controllerKey).string();
        controller != nullptr && settingsWritten && isLookedUp(*controller)) {
        visible.settings.remove(controllerKey);  // what stands there now is what the service made of it
    }
    for (WantedProperty& property : visible.properties) {
        property.writeSecret = false;
        const ListedProperty* stored = property.remove ? nullptr : findProperty(before, property.name);
        if (stored == nullptr) {
            continue;
        }
        const bool becomes = property.isProtected.value_or(stored->isProtected);
        const std::string entry = "properties." + tomlKey(property.name);
        const bool refused = logs(log, {"could not update property with id: " + stored->id + ','});
        addIf(becomes && refused, entry + ".value");
        addIf(stored->isProtected && !becomes && !property.value && cipherFailed(log), entry + ".protect");
    }
    std::erase_if(visible.cameras, [&](const WantedCamera& camera) {
        const bool gone = camera.remove && after.cameras && findCamera(after, camera.key) == nullptr;
        return gone;
    });
    try {
        for (PlannedChange& change : planOf(visible, after).changes) {
            const bool named = std::any_of(failed.begin(), failed.end(),
                                           [&](const PlannedChange& one) { return one.entry == change.entry; });
            if (!named) {
                failed.push_back(std::move(change));
            }
        }
    } catch (const Failure&) {
        return plan.changes;  // what was there before is no more, or cannot be read: nothing is known to have taken
    }
    return failed;
}

}  // namespace adminhost::ctl
