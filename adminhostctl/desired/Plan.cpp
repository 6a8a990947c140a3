#include "adminhostctl/desired/Plan.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/desired/Toml.h"
#include "platform/value/ValueText.h"

#include <algorithm>

#include <fmt/format.h>

namespace adminhost::ctl {
namespace {

constexpr std::string_view secretText = "(secret)";
constexpr const char* allowedText = "(allowed)";
constexpr const char* notAllowedText = "(not allowed)";
constexpr const char* removedText = "(removed)";

std::string textOrSecret(bool hidden, const Value& value) {
    return hidden ? std::string(secretText) : valueForPeople(value);
}

template <typename Range, typename Element>
bool contains(const Range& range, const Element& element) {
    return std::find(std::begin(range), std::end(range), element) != std::end(range);
}

/// The settings files whose paths change when the wanted settings are written.
std::set<std::string> movedFiles(const StateForm& form, const Wanted& wanted, const State& state) {
    std::set<std::string> files;
    for (const DescribedKey& key : form.settings()) {
        const Value& value = wanted.settings.get(form.nameOf(key));
        if (!value.isNull() && value != state.settings.get(form.nameOf(key))) {
            files.insert(key.locates.begin(), key.locates.end());
        }
    }
    return files;
}

void planSetting(Plan& plan, const StateForm& form, const Wanted& wanted, const DictionaryEntry& entry,
                 const State& state, bool moved) {
    const DescribedKey* key = form.setting(entry.key);
    const Value& stored = state.settings.get(entry.key);
    const std::string name = form.settingsSection() + '.' + entry.key;
    const std::string unit = key != nullptr ? key->unit : "";
    const bool differs = entry.value != stored;
    if (differs && !moved && key != nullptr && !wanted.lookUp && isLookedUp(*key, entry.value)) {
        plan.notes.push_back(name + ": " + valueForPeople(entry.value) +
                             " is looked up by the write, so it is left at " + valueForPeople(stored) +
                             "; \"settings set " + entry.key + "\" writes it, then put the stored name here");
        return;
    }
    if (differs) {
        plan.changes.push_back({name,
                                valueForPeople(stored, unit),
                                valueForPeople(entry.value, unit),
                                form.root() + '.' + entry.key,
                                false,
                                {},
                                entry.key,
                                form.settingsSection(),
                                {},
                                stored,
                                entry.value});
        for (const std::string& command : key != nullptr ? key->restart : std::vector<std::string>()) {
            if (!contains(plan.restart, command)) {
                plan.restart.push_back(command);
            }
        }
    }
    // A value that is equal now may differ in the file that is used after the move.
    if (differs || moved) {
        plan.root.set(entry.key, entry.value);
    }
}

void planSettings(Plan& plan, const StateForm& form, const Wanted& wanted, const State& state) {
    const std::set<std::string> moved = movedFiles(form, wanted, state);
    for (const DictionaryEntry& entry : wanted.settings) {
        const DescribedKey* key = form.setting(entry.key);
        planSetting(plan, form, wanted, entry, state, key != nullptr && moved.count(key->file) > 0);
    }
    for (const auto& [name, value] : wanted.secrets) {
        const DescribedKey* key = form.secret(name);
        const bool isSet = key != nullptr && booleanOf(state.settings.get(key->shownBy));
        if (!value.empty() || isSet) {
            plan.changes.push_back({form.settingsSection() + '.' + name,
                                    isSet ? std::string(secretText) : "(not set)",
                                    value.empty() ? "(not set)" : std::string(secretText),
                                    form.root() + '.' + name,
                                    true,
                                    {},
                                    name,
                                    form.settingsSection(),
                                    {},
                                    valueForPrograms(isSet ? Value(true) : Value(), true),
                                    valueForPrograms(value.empty() ? Value() : Value(true), true),
                                    true});
            plan.root.set(name, value);
        }
    }
    plan.moves = !moved.empty();
    std::string unlisted;
    for (const DescribedKey& key : form.settings()) {
        const std::string name = form.nameOf(key);
        if (moved.count(key.file) > 0 && !wanted.settings.contains(name) && !state.settings.get(name).isNull()) {
            unlisted += (unlisted.empty() ? "" : ", ") + name;
            plan.movedAlong.push_back(name);
        }
    }
    if (!unlisted.empty()) {
        plan.consequences.push_back(form.settingsSection() + ": read from other files then, which may not have them: " +
                                    unlisted + "; \"adminhostctl export\" writes all settings down");
    }
    for (const DescribedKey& key : form.secrets()) {
        const std::string name = form.nameOf(key);
        if (moved.count(key.file) > 0 && wanted.secrets.count(name) == 0 &&
            booleanOf(state.settings.get(key.shownBy))) {
            plan.notes.push_back(
                fmt::format("{}.{}: a secret, read from another file then; \"settings set {}\" sets it there",
                            form.settingsSection(), name, name));
        }
    }
}

/// Changes of the elements of one section.
class Section {
  public:
    Section(Plan& plan, const StateForm& form, const ListForm& list, const State& state)
        : _plan(plan), _list(list), _state(state), _path(form.root() + '.' + list.key + '.') {}

    void change(const WantedElement& wanted, const std::set<std::string>& removeUnlisted) {
        _name = wanted.shownAs.empty() ? wanted.name : wanted.shownAs;
        _entry = _list.section + '.' + tomlKey(_name);
        _element = findElement(_state, _list, wanted.name);
        if (wanted.remove) {
            remove();
        } else if (_element == nullptr) {
            add(wanted);
        } else {
            Dictionary record{{_list.identity, _element->identity}};
            changeFields(record, wanted);
            for (const PeopleForm& people : _list.people) {
                changePeople(record, people, wanted, removeUnlisted.count(people.unlisted) > 0);
            }
            if (record.size() > 1) {
                _records.emplace_back(std::move(record));
            }
        }
    }

    /// Removes the elements that a file can name and does not list.
    void removeUnlisted(const std::vector<WantedElement>& listed) {
        std::multiset<std::string> labels;
        for (const Element& element : elementsOf(_state, _list)) {
            labels.insert(element.label);
        }
        for (const Element& element : elementsOf(_state, _list)) {
            const bool isListed = std::any_of(listed.begin(), listed.end(),
                                              [&](const WantedElement& one) { return one.name == element.label; });
            if (!element.label.empty() && labels.count(element.label) == 1 && !isListed) {
                change({element.label, {}, {}, {}, true, false}, {});
            }
        }
    }

    /// Stores the records in the request under their keys.
    void finish() {
        if (!_records.empty()) {
            _plan.root.set(_list.key, std::move(_records));
        }
    }

  private:
    /// Adds a change of the element, whose entry, words, values and key are set.
    void push(PlannedChange change, const std::string& below) {
        change.keyPath = recordPath() + (below.empty() ? "" : '.' + below);
        change.identity = _element != nullptr ? _element->identity : "";
        change.section = _list.section;
        change.name = _name;
        _plan.changes.push_back(std::move(change));
    }
    [[nodiscard]] std::string recordPath() const { return _path + std::to_string(_records.size()); }

    void remove() {
        if (_element == nullptr) {
            return;
        }
        PlannedChange change{.entry = _entry, .from = "(present)", .to = removedText, .before = true};
        for (const FieldForm& field : _list.fields) {
            if (!field.boolean) {
                const Value& value = _element->fields.get(field.key);
                change.secret = isSecret(field, *_element);
                change.from = textOrSecret(change.secret, value);
                change.before = change.secret ? Value(secretText) : value;
                break;
            }
        }
        push(std::move(change), "");
        _records.emplace_back(Dictionary{{_list.identity, _element->identity}, {_list.removedBy, true}});
    }

    void add(const WantedElement& wanted) {
        if (_list.addedBy.empty()) {
            throw usageError(_entry + ": not found; \"adminhostctl export\" lists the names");
        }
        if (wanted.name.empty()) {
            throw usageError(_entry + ": the name is empty");
        }
        Dictionary record{{_list.addedBy, true}, {_list.label, wanted.name}};
        PlannedChange change{.entry = _entry, .from = "(not present)", .to = "(added)", .after = true};
        for (const FieldForm& field : _list.fields) {
            const Value& value = wanted.fields.get(field.key);
            if (!field.boolean && value.isNull()) {
                throw usageError(wanted.place + (wanted.place.empty() ? "" : ": ") + _entry +
                                 ": not found, and adding it needs a " + field.inFile);
            }
            if (!field.boolean) {
                change.secret = wanted.fields.get(field.secretIf).boolean().value_or(false);
                change.to = textOrSecret(change.secret, value);
                change.after = valueForPrograms(value, change.secret);
            }
            if (!field.boolean || value.boolean().value_or(false)) {
                record.set(field.key, value);
            }
        }
        push(std::move(change), "");
        _records.emplace_back(std::move(record));
    }

    void changeFields(Dictionary& record, const WantedElement& wanted) {
        for (const FieldForm& field : _list.fields) {
            const Value& value = wanted.fields.get(field.key);
            const Value& stored = _element->fields.get(field.key);
            if (value.isNull() || value == stored) {
                continue;
            }
            const bool isHidden = isSecret(field, *_element);
            const bool becomesHidden = wanted.fields.get(field.secretIf).boolean().value_or(isHidden);
            if (isHidden && becomesHidden && !wanted.writeSecret) {
                _plan.notes.push_back(_entry + '.' + field.inFile +
                                      ": (secret), cannot be compared and is left as it is; set it by its own verb");
                continue;
            }
            const bool switchesSecrecy =
                std::any_of(_list.fields.begin(), _list.fields.end(),
                            [&](const FieldForm& other) { return other.secretIf == field.key; });
            push({.entry = _entry + '.' + field.inFile,
                  .from = textOrSecret(isHidden, stored),
                  .to = textOrSecret(becomesHidden, value),
                  .hidden = becomesHidden || switchesSecrecy,
                  .key = field.key,
                  .before = isHidden ? Value(secretText) : stored,
                  .after = valueForPrograms(value, becomesHidden),
                  .secret = isHidden || becomesHidden},
                 field.key);
            record.set(field.key, value);
        }
    }

    void changePeople(Dictionary& record, const PeopleForm& form, const WantedElement& wanted, bool removeOthers) {
        Array entries;
        static const std::vector<Person> none;
        const auto found = _element->people.find(form.key);
        const std::vector<Person>& present = found != _element->people.end() ? found->second : none;
        for (const auto& [kind, list] : form.kinds) {
            const auto names = wanted.lists.find(list);
            if (names == wanted.lists.end()) {
                continue;
            }
            for (const std::string& name : names->second) {
                if (name.empty()) {
                    throw usageError(_entry + '.' + list + ": a name is empty");
                }
                const bool isAllowed = std::any_of(
                    present.begin(), present.end(),
                    [&, &wantedKind = kind](const Person& p) { return p.kind == wantedKind && p.label == name; });
                if (!isAllowed && pushPerson(entries, form, list, name, true)) {
                    entries.emplace_back(Dictionary{{form.addedBy, true}, {form.kind, kind}, {form.label, name}});
                }
            }
            // People without a short name cannot be listed in a file: they stay.
            for (const Person& person : present) {
                if (removeOthers && person.kind == kind && !person.label.empty() &&
                    !contains(names->second, person.label)) {
                    deny(entries, form, person);
                }
            }
        }
        for (const Person& denied : wanted.denied) {
            for (const Person& person : present) {
                if (person.label == denied.label && (denied.kind.empty() || denied.kind == person.kind)) {
                    deny(entries, form, person);
                }
            }
        }
        if (!entries.empty()) {
            record.set(form.key, std::move(entries));
        }
    }

    void deny(Array& entries, const PeopleForm& form, const Person& person) {
        for (const auto& [kind, list] : form.kinds) {
            if (kind == person.kind && pushPerson(entries, form, list, person.label, false)) {
                entries.emplace_back(Dictionary{{form.removedBy, true}, {form.identity, person.identity}});
            }
        }
    }

    /// Returns false if the same change is planned already.
    bool pushPerson(const Array& entries, const PeopleForm& form, const std::string& list, const std::string& name,
                    bool allowed) {
        const std::string entry = _entry + '.' + list + '.' + tomlKey(name);
        PlannedChange change{.entry = entry,
                             .from = allowed ? notAllowedText : allowedText,
                             .to = allowed ? allowedText : notAllowedText,
                             .key = list,
                             .before = allowed ? Value() : Value(name),
                             .after = allowed ? Value(name) : Value()};
        if (contains(_plan.changes, change)) {
            return false;
        }
        push(std::move(change), form.key + '.' + std::to_string(entries.size()));
        return true;
    }

    Plan& _plan;
    const ListForm& _list;
    const State& _state;
    std::string _path;
    Array _records;
    std::string _name;
    std::string _entry;
    const Element* _element = nullptr;
};

}  // namespace

std::string valueForPeople(const Value& value, const std::string& unit) {
    if (value.isNull()) {
        return "(not set)";
    }
    if (const auto boolean = value.boolean()) {
        return *boolean ? "yes" : "no";
    }
    // A number that is stored as text differs from the number.
    if (std::string text = textWithUnit(value, unit); !text.empty() && value.string() == nullptr) {
        return text;
    }
    return tomlValue(value).value_or("(" + std::string(nameOf(value.type())) + ")");
}

Value valueForPrograms(const Value& value, bool secret) {
    return secret && !value.isNull() ? Value(secretText) : value;
}

bool isLookedUp(const DescribedKey& setting, const Value& value) {
    constexpr std::string_view local = ".local";
    const std::string* name = value.string();
    if (setting.lookedUp != "local_name" || name == nullptr) {
        return false;
    }
    if (name->ends_with(local)) {
        return name->size() > local.size();
    }
    return !name->empty() && name->find('.') == std::string::npos;
}

Plan planOf(const StateForm& form, const Wanted& wanted, const State& state) {
    Plan plan;
    planSettings(plan, form, wanted, state);
    static const std::vector<WantedElement> none;
    for (const ListForm& list : form.lists()) {
        const auto found = wanted.elements.find(list.section);
        const std::vector<WantedElement>& elements = found != wanted.elements.end() ? found->second : none;
        Section section(plan, form, list, state);
        for (const WantedElement& element : elements) {
            section.change(element, wanted.removeUnlisted);
        }
        const bool isChosen = wanted.only.empty() || wanted.only.contains(list.section);
        if (isChosen && !list.unlisted.empty() && wanted.removeUnlisted.count(list.unlisted) > 0) {
            section.removeUnlisted(elements);
        }
        section.finish();
    }
    return plan;
}

}  // namespace adminhost::ctl
