#include "adminhostctl/desired/LookingBack.h"

#include "adminhostctl/Connection.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/RequestArguments.h"
#include "adminhostctl/Since.h"
#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/Toml.h"
#include "adminhostctl/desired/Writing.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cstdint>
#include <ctime>
#include <iterator>
#include <map>
#include <optional>

#include <fmt/format.h>

namespace adminhost::ctl {
namespace {

constexpr std::string_view droppedKey = "changesDropped";

/// Names of the settings that a write can set and reading shows.
std::vector<std::string> writableKeys(const StateForm& form) {
    std::vector<std::string> keys;
    for (const DescribedKey& key : form.settings()) {
        keys.push_back(form.nameOf(key));
    }
    return keys;
}

/// As plans show it; long texts, certificates for instance, only by their beginning.
std::string valueText(const Value& value, const char* null, const std::string& unit = {}) {
    constexpr std::size_t widest = 60;
    std::string text = value.isNull() ? null : valueForPeople(value, unit);
    return widthOf(text) <= widest ? text : wrapped(text, widest).front() + "...";
}

/// What became of a setting: "port: 80 -> 81".
std::string settingChangeText(const StateForm& form, const Dictionary& change) {
    const std::string key = shown(change.text("key"));
    const DescribedKey* described = form.setting(change.text("key"));
    const std::string unit = described != nullptr ? described->unit : "";
    if (change.get("secret") == Value(true)) {
        return key + ": " + (change.get("to").isNull() ? "(secret) removed" : "(secret) changed");
    }
    return key + ": " + valueText(change.get("from"), "(not set)", unit) + " -> " +
           valueText(change.get("to"), "(not set)", unit);
}

/// What became of an element of a list, named as plans name it: "SECTION.NAME.LIST.anna: (not allowed) -> (allowed)".
std::string elementChangeText(const StateForm& form, const Dictionary& change) {
    const std::string key(change.text("key"));
    const std::string name(change.text("name"));
    const Value& from = change.get("from");
    const Value& to = change.get("to");
    const auto list = std::find_if(form.lists().begin(), form.lists().end(),
                                   [&](const ListForm& one) { return one.key == change.text("section"); });
    const bool isKnown = list != form.lists().end();
    std::string entry = shown(isKnown ? list->section : change.text("section")) + '.' +
                        tomlKey(name.empty() ? change.text("identity") : name);
    const std::string doubt = change.get("unverified") == Value(true) ? " (if it existed)" : "";
    if (key.empty()) {
        return entry + (from.isNull() ? ": (not present) -> (present)" : ": (present) -> (not present)") + doubt;
    }
    const FieldForm* field = isKnown ? list->fieldOf(key) : nullptr;
    entry += '.' + shown(field == nullptr ? key : field->inFile);
    if (change.get("secret") == Value(true)) {
        return entry + ": (secret) changed";
    }
    if (isKnown && list->isPeople(key)) {
        return entry + '.' + tomlKey(textOf(from.isNull() ? to : from)) +
               (from.isNull() ? ": (not allowed) -> (allowed)" : ": (allowed) -> (not allowed)");
    }
    // The service's tools change elements without reading them first.
    return entry + ": " + valueText(from, "(not known)") + " -> " + valueText(to, "(not set)") + doubt;
}

/// How many changes of a request its entry does not hold, because there were too many.
std::uint64_t droppedChanges(const Dictionary& entry) {
    return entry.get(droppedKey).unsignedInteger().value_or(0);
}

/// What an entry changed, a line each.
std::vector<std::string> changeTexts(const StateForm& form, const Dictionary& entry) {
    const Array* changes = entry.get("changes").array();
    if (changes == nullptr) {
        return {"not recorded"};
    }
    std::vector<std::string> texts;
    for (const Value& value : *changes) {
        if (const Dictionary* change = value.dictionary()) {
            texts.push_back(change->contains("section") ? elementChangeText(form, *change)
                                                        : settingChangeText(form, *change));
        }
    }
    if (const std::uint64_t dropped = droppedChanges(entry); dropped > 0) {
        texts.push_back(fmt::format("and {} more, which are not recorded", dropped));
    }
    return texts;
}

/// The list of the answer's dictionaries.
Array listAt(const Value& answer, std::string_view key) {
    const Array* list = answer.dictionary() == nullptr ? nullptr : answer.dictionary()->get(key).array();
    Array entries;
    for (const Value& entry : list == nullptr ? Array() : *list) {
        if (entry.dictionary() != nullptr) {
            entries.push_back(entry);
        }
    }
    return entries;
}

/// Adds changes of elements to the entry of the write that made them, if that has one.
bool addTo(Array& entries, const Dictionary& resources) {
    const std::string_view request = resources.text("request");
    for (Value& value : entries) {
        Value* changes = value.dictionary()->find("changes");
        const Array* more = resources.get("changes").array();
        if (!request.empty() && value.dictionary()->text("request") == request && changes != nullptr &&
            changes->array() != nullptr && more != nullptr) {
            changes->array()->insert(changes->array()->end(), more->begin(), more->end());
            if (resources.contains(droppedKey)) {
                value.dictionary()->set(droppedKey, resources.get(droppedKey));
            }
            return true;
        }
    }
    return false;
}

/// The plug-in's history, oldest first, one entry for each write. The numbers of entries without settings begin with
/// "r".
Array entriesOf(const Context& context, const CommandRef& write) {
    const Value answer = context.service.get("/v1/" + Connection::escaped(write.plugin) + "/history");
    Array entries = listAt(answer, "history");
    Array others;
    for (Value& resources : listAt(answer, "resources")) {
        if (!addTo(entries, *resources.dictionary())) {
            // They have numbers of their own.
            resources.dictionary()->set("number", "r" + textOf(resources.dictionary()->get("number")));
            others.push_back(std::move(resources));
        }
    }
    std::move(others.begin(), others.end(), std::back_inserter(entries));
    std::stable_sort(entries.begin(), entries.end(), [](const Value& a, const Value& b) {
        return a.dictionary()->get("when").date() < b.dictionary()->get("when").date();
    });
    return entries;
}

/// The changes of an entry; null if it has none.
Array* changesOf(Value& entry) {
    Value* const changes = entry.dictionary()->find("changes");
    return changes == nullptr ? nullptr : changes->array();
}

/// Names of elements by their identities, as the service has them now; empty if they cannot be read.
std::map<std::string, std::string> namesByIdentity(const Context& context) {
    std::map<std::string, std::string> names;
    try {
        const CommandRef command = context.service.stateCommand("names");
        const CommandAnswer answer = context.service.ask(command, {});
        for (const DescribedKey& key : command.description.answerKeys()) {
            if (key.identity.empty() || !key.path.ends_with("[]")) {
                continue;
            }
            for (const Value& element :
                 listAt(answer.value.value_or(Value()), key.path.substr(0, key.path.size() - 2))) {
                names[std::string(element.dictionary()->text(key.identity))] = element.dictionary()->text(key.label);
            }
        }
    } catch (const Failure&) {
        // The history is shown with identities then: it may be needed most while the service cannot be read.
    }
    return names;
}

/// Names the elements that the daemon has recorded by their identity only, because the change did not read them.
void addNames(const Context& context, Array& entries) {
    std::optional<std::map<std::string, std::string>> names;
    for (Value& entry : entries) {
        Array* const changes = changesOf(entry);
        if (changes == nullptr) {
            continue;
        }
        for (Value& value : *changes) {
            Dictionary* const change = value.dictionary();
            if (change == nullptr || !change->contains("identity") || !change->text("name").empty()) {
                continue;
            }
            if (!names) {
                names = namesByIdentity(context);
            }
            if (const auto found = names->find(std::string(change->text("identity"))); found != names->end()) {
                change->set("name", found->second);
            }
        }
    }
}

const Dictionary& dictionaryAt(const Dictionary& dictionary, std::string_view key) {
    static const Dictionary none;
    const Dictionary* found = dictionary.get(key).dictionary();
    return found == nullptr ? none : *found;
}

/// "31 Jan 2026, 09:00:05 CET".
std::string momentText(Date date) {
    const std::time_t seconds = date.time_since_epoch().count();
    std::tm parts{};
    return ::localtime_r(&seconds, &parts) == nullptr
               ? dateText(date)
               : fmt::format("{}:{:02} {}", dateText(date), parts.tm_sec, parts.tm_zone);
}

/// Whether the account is one of an entry's: its name, or its number.
bool isBy(const Dictionary& entry, const std::string& account) {
    const std::string_view who = entry.text("who");
    return who.starts_with(account + " (") || who.find(", as " + account + " (") != std::string::npos ||
           textOf(entry.get("uid")) == account;
}

/// Leaves the entries and changes that the options ask for.
void filter(const Context& context, Array& entries) {
    const std::optional<Date> since = sinceOf(context);
    const std::string user = context.options.argumentOf(userOption);
    const std::string wanted = context.options.argumentOf(keyOption);
    std::erase_if(entries, [&](Value& value) {
        Dictionary& entry = *value.dictionary();
        const auto when = entry.get("when").date();
        if ((since && (!when || *when < *since)) || (context.options.has(userOption) && !isBy(entry, user))) {
            return true;
        }
        if (!context.options.has(keyOption)) {
            return false;
        }
        Array* const changes = changesOf(value);
        if (changes == nullptr) {
            return true;
        }
        std::erase_if(*changes, [&](const Value& change) {
            const Dictionary* one = change.dictionary();
            return one == nullptr ||
                   (one->text("key") != wanted && one->text("name") != wanted && one->text("section") != wanted);
        });
        return changes->empty();
    });
}

/// What a rollback changes, and what it cannot restore.
struct Restoration {
    Wanted wanted;
    std::vector<std::string> lost;   ///< parts of the earlier state that cannot be restored
    std::vector<std::string> notes;  ///< secrets, which stay as they are
};

/// Whether the setting has been changed by the entry or since.
bool isChangedSince(const Array& entries, Array::const_iterator entry, const std::string& setting) {
    return std::any_of(entry, entries.end(), [&](const Value& later) {
        const Array* const changes = later.dictionary()->get("changes").array();
        return changes != nullptr && std::any_of(changes->begin(), changes->end(), [&](const Value& change) {
                   return change.dictionary() != nullptr && !change.dictionary()->contains("section") &&
                          change.dictionary()->text("key") == setting;
               });
    });
}

void restoreSettings(Restoration& restoration, const Array& entries, Array::const_iterator entry,
                     const CurrentState& current) {
    const Dictionary& settings = dictionaryAt(*entry->dictionary(), "settings");
    const StateForm& form = current.form;
    for (const std::string& key : writableKeys(form)) {
        if (settings.contains(key)) {
            restoration.wanted.settings.set(key, settings.get(key));
        } else if (current.state.settings.contains(key)) {
            restoration.lost.push_back(form.settingsSection() + '.' + key +
                                       ": not set at that time; it cannot be removed and stays " +
                                       valueText(current.state.settings.get(key), "(not set)"));
        }
    }
    for (const DescribedKey& key : form.secrets()) {
        if (settings.contains(form.nameOf(key)) && isChangedSince(entries, entry, form.nameOf(key))) {
            restoration.notes.push_back(form.settingsSection() + '.' + form.nameOf(key) +
                                        ": not restored, a stored secret cannot be written back");
        }
    }
}

/// The value before the change; null if it is not known. A change of an element that was not read has it only in the
/// request that undoes it.
Value valueBefore(const ListForm& list, const Dictionary& change) {
    if (const Value& from = change.get("from"); !from.isNull()) {
        return from;
    }
    const Array* undone = dictionaryAt(change, "undo").get(list.key).array();
    const Dictionary* element = undone == nullptr || undone->empty() ? nullptr : undone->front().dictionary();
    return element == nullptr ? Value() : element->get(change.text("key"));
}

/// The kind of the people in a list with this name.
std::string kindOf(const ListForm& list, const std::string& inFile) {
    for (const PeopleForm& people : list.people) {
        for (const auto& [kind, name] : people.kinds) {
            if (name == inFile) {
                return kind;
            }
        }
    }
    return {};
}

void restoreChange(Restoration& restoration, const ListForm& list, const Dictionary& change,
                   const CurrentState& current) {
    const std::string key(change.text("key"));
    const std::vector<Element>& all = elementsOf(current.state, list);
    // The database chooses the identity of an element that is added: the change has only its name.
    const auto present = std::find_if(all.begin(), all.end(), [&](const Element& element) {
        return change.text("identity").empty() ? element.label == change.text("name")
                                               : element.identity == change.text("identity");
    });
    const bool isPresent = present != all.end();
    const std::string name(!isPresent ? change.text("name") : present->label);
    Dictionary named = change;
    if (named.text("name").empty()) {
        named.set("name", name);
    }
    const std::string line = elementChangeText(current.form, named);
    const auto lose = [&](const char* why) { restoration.lost.push_back(line + ": not restored, " + why); };
    WantedElement wanted{list.byIdentity && isPresent ? present->identity : name, {}, {}, {}, false, false};
    wanted.shownAs = name;
    if (change.get("secret") == Value(true)) {
        lose("a stored secret cannot be written back");
        return;
    }
    if (key.empty() && change.get("from").isNull()) {
        wanted.remove = true;
        if (!isPresent) {
            return;  // it has been removed since
        }
    } else if (key.empty()) {
        const FieldForm* const text = list.addedBy.empty() || list.fields.empty() ? nullptr : &list.fields.front();
        const Value& value = text == nullptr ? Value() : change.get("from");
        if (isPresent) {
            return;
        }
        if (text == nullptr || value.string() == nullptr || name.empty()) {
            lose("what was removed cannot be added again");
            return;
        }
        wanted.fields.set(text->key, value);
    } else if (!isPresent) {
        lose("it no longer exists");
        return;
    } else if (list.isPeople(key)) {
        const Value& from = change.get("from");
        if (from.isNull()) {
            wanted.denied.push_back({kindOf(list, key), textOf(change.get("to")), ""});
        } else {
            wanted.lists[key] = {textOf(from)};
        }
    } else if (list.fieldOf(key) == nullptr) {
        lose("a rollback cannot write this part");
        return;
    } else if (const Value before = valueBefore(list, change); !before.isNull()) {
        wanted.fields.set(key, before);
    } else {
        lose("the earlier value is not known");
        return;
    }
    restoration.wanted.elements[list.section].push_back(std::move(wanted));
}

/// The only section that the entry concerns; empty if it concerns several.
std::string sectionOf(const StateForm& form, const Dictionary& entry) {
    std::string section = entry.contains("settings") ? form.settingsSection() : "";
    const Array* changes = entry.get("changes").array();
    for (const Value& change : changes == nullptr ? Array() : *changes) {
        for (const ListForm& list : form.lists()) {
            if (change.dictionary() == nullptr || change.dictionary()->get("section") != Value(list.key)) {
                continue;
            }
            if (!section.empty() && section != list.section) {
                return {};
            }
            section = list.section;
        }
    }
    return section;
}

/// Everything that the entry, one of these, changed, as it was before. Settings are restored as a whole.
Restoration restorationOf(const Array& entries, Array::const_iterator entry, const CurrentState& current) {
    Restoration restoration;
    restoration.wanted.lookUp = true;
    if (entry->dictionary()->contains("settings")) {
        restoreSettings(restoration, entries, entry, current);
    }
    const Array* changes = entry->dictionary()->get("changes").array();
    // The last change of a thing is undone first.
    for (std::size_t i = changes == nullptr ? 0 : changes->size(); i > 0; --i) {
        const Dictionary* change = (*changes)[i - 1].dictionary();
        if (change == nullptr || !change->contains("section")) {
            continue;  // a setting
        }
        const std::vector<ListForm>& lists = current.form.lists();
        const auto list = std::find_if(lists.begin(), lists.end(),
                                       [&](const ListForm& one) { return change->get("section") == Value(one.key); });
        if (list != lists.end()) {
            restoreChange(restoration, *list, *change, current);
        } else {
            restoration.lost.push_back(elementChangeText(current.form, *change) +
                                       ": not restored, a rollback cannot write this part");
        }
    }
    if (const std::uint64_t dropped = droppedChanges(*entry->dictionary()); dropped > 0) {
        restoration.lost.push_back(
            fmt::format("{} more changes of that request: not restored, the history does not hold them", dropped));
    }
    return restoration;
}

}  // namespace

std::vector<std::string> historyNumbersOf(const Context& context) {
    std::vector<std::string> numbers;
    for (const Value& entry : entriesOf(context, context.service.stateCommand("write"))) {
        numbers.push_back(textOf(entry.dictionary()->get("number")));
    }
    std::reverse(numbers.begin(), numbers.end());
    return numbers;
}

ExitStatus history(const Context& context, std::span<const std::string>) {
    const CommandRef write = context.service.stateCommand("write");
    Array entries = entriesOf(context, write);
    addNames(context, entries);
    filter(context, entries);
    if (context.options.format != Format::text) {
        for (Value& entry : entries) {
            entry.dictionary()->remove("settings");
        }
        writeValue(context, entries, Description());
        return ExitStatus::done;
    }
    if (entries.empty()) {
        context.out << (context.options.own.empty() ? "No change has been recorded yet.\n"
                                                    : "No such change has been recorded.\n");
        return ExitStatus::done;
    }
    const StateForm form(write.description);
    Table table({"number", "when", "who", "changed"});
    table.keep(3);
    // The newest first: that is the one that people look for.
    for (auto at = entries.rbegin(); at != entries.rend(); ++at) {
        const Dictionary& entry = *at->dictionary();
        const Value& number = entry.get("number");
        const auto when = entry.get("when").date();
        // The daemon notices an edit outside when the next write comes.
        const char* const before = entry.get("outside") == Value(true) ? "before " : "";
        std::vector<std::string> row{number.isNull() ? "" : textOf(number), when ? before + momentText(*when) : "",
                                     shown(entry.text("who")), ""};
        for (std::string& change : changeTexts(form, entry)) {
            row.back() = std::move(change);
            table.addRow(row);
            row.assign(row.size(), "");
        }
    }
    context.out << table.text(context.options.width, 0) << '\n';
    for (const std::string& line :
         wrapped("adminhostctl rollback NUMBER restores the state before that change; --dry-run shows how.",
                 context.options.width)) {
        context.out << line << '\n';
    }
    return ExitStatus::done;
}

ExitStatus rollback(const Context& context, std::span<const std::string> arguments) {
    const CommandRef write = context.service.stateCommand("write");
    const Array entries = entriesOf(context, write);
    const auto found = std::find_if(entries.begin(), entries.end(), [&](const Value& entry) {
        const Value& number = entry.dictionary()->get("number");
        return !number.isNull() && textOf(number) == arguments.front();
    });
    if (found == entries.end()) {
        throw usageError("history entry not found: " + arguments.front() + "; \"adminhostctl history\" lists them");
    }
    const CurrentState current = readState(context, sectionOf(StateForm(write.description), *found->dictionary()));
    requireWhole(current);
    const Restoration restoration = restorationOf(entries, found, current);
    // Before anything is written.
    for (const std::string& lost : restoration.lost) {
        context.err << "adminhostctl: " << shown(lost) << '\n';
    }
    if (!planOf(current.form, restoration.wanted, current.state).changes.empty()) {
        for (const std::string& note : restoration.notes) {
            context.err << shown(note) << '\n';
        }
    }
    context.err.flush();
    const ExitStatus status = carryOut(context, restoration.wanted, current);
    return status == ExitStatus::done && !restoration.lost.empty() ? ExitStatus::failed : status;
}

}  // namespace adminhost::ctl
