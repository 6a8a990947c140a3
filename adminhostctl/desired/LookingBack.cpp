#include "adminhostctl/desired/LookingBack.h"

#include "adminhostctl/Connection.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/Toml.h"
#include "adminhostctl/desired/Writing.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <iterator>

namespace adminhost::ctl {
namespace {

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

std::string textAt(const Dictionary& dictionary, std::string_view key) {
    const std::string* text = dictionary.get(key).string();
    return text == nullptr ? "" : *text;
}

/// What became of a setting: "port: 80 -> 81".
std::string settingChangeText(const StateForm& form, const Dictionary& change) {
    const std::string key = shown(textAt(change, "key"));
    const DescribedKey* described = form.setting(textAt(change, "key"));
    const std::string unit = described != nullptr ? described->unit : "";
    if (change.get("secret") == Value(true)) {
        return key + ": " + (change.get("to").isNull() ? "(secret) removed" : "(secret) changed");
    }
    return key + ": " + valueText(change.get("from"), "(not set)", unit) + " -> " +
           valueText(change.get("to"), "(not set)", unit);
}

/// What became of an element of a list, named as plans name it: "SECTION.NAME.LIST.anna: (not allowed) -> (allowed)".
std::string elementChangeText(const StateForm& form, const Dictionary& change) {
    const std::string key = textAt(change, "key");
    const std::string name = textAt(change, "name");
    const Value& from = change.get("from");
    const Value& to = change.get("to");
    const auto list = std::find_if(form.lists().begin(), form.lists().end(),
                                   [&](const ListForm& one) { return one.key == textAt(change, "section"); });
    const bool isKnown = list != form.lists().end();
    std::string entry = shown(isKnown ? list->section : textAt(change, "section")) + '.' +
                        tomlKey(name.empty() ? textAt(change, "identity") : name);
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
    const std::string request = textAt(resources, "request");
    for (Value& value : entries) {
        Value* changes = value.dictionary()->find("changes");
        const Array* more = resources.get("changes").array();
        if (!request.empty() && textAt(*value.dictionary(), "request") == request && changes != nullptr &&
            changes->array() != nullptr && more != nullptr) {
            changes->array()->insert(changes->array()->end(), more->begin(), more->end());
            return true;
        }
    }
    return false;
}

/// The plug-in's history, oldest first, one entry for each write. Entries of settings have a number.
Array entriesOf(const Context& context, const CommandRef& write) {
    const Value answer = context.service.get("/v1/" + Connection::escaped(write.plugin) + "/history");
    Array entries = listAt(answer, "history");
    Array others;
    for (Value& resources : listAt(answer, "resources")) {
        if (!addTo(entries, *resources.dictionary())) {
            // They have numbers of their own, which rollback does not know.
            resources.dictionary()->remove("number");
            others.push_back(std::move(resources));
        }
    }
    std::move(others.begin(), others.end(), std::back_inserter(entries));
    std::stable_sort(entries.begin(), entries.end(), [](const Value& a, const Value& b) {
        return a.dictionary()->get("when").date() < b.dictionary()->get("when").date();
    });
    return entries;
}

const Dictionary& dictionaryAt(const Dictionary& dictionary, std::string_view key) {
    static const Dictionary none;
    const Dictionary* found = dictionary.get(key).dictionary();
    return found == nullptr ? none : *found;
}

}  // namespace

ExitStatus history(const Context& context, std::span<const std::string>) {
    const CommandRef write = context.service.stateCommand("write");
    const Array entries = entriesOf(context, write);
    if (context.options.format != Format::text) {
        writeValue(context, entries, Description());
        return ExitStatus::done;
    }
    if (entries.empty()) {
        context.out << "No change has been recorded yet.\n";
        return ExitStatus::done;
    }
    const StateForm form(write.description);
    Table table({"number", "when", "who", "changed"});
    // The newest first: that is the one that people look for.
    for (auto at = entries.rbegin(); at != entries.rend(); ++at) {
        const Dictionary& entry = *at->dictionary();
        const Value& number = entry.get("number");
        const auto when = entry.get("when").date();
        // The daemon notices an edit outside when the next write comes.
        const char* const before = entry.get("outside") == Value(true) ? "before " : "";
        std::vector<std::string> row{number.isNull() ? "" : textOf(number), when ? before + dateText(*when) : "",
                                     shown(textAt(entry, "who")), ""};
        for (std::string& change : changeTexts(form, entry)) {
            row.back() = std::move(change);
            table.addRow(row);
            row.assign(row.size(), "");
        }
    }
    context.out << table.text(context.options.width, 0)
                << "\nadminhostctl rollback NUMBER restores the settings as they were before that change.\n";
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
    const Dictionary& settings = dictionaryAt(*found->dictionary(), "settings");
    const CurrentState current = readState(context);
    requireWhole(current);
    const StateForm& form = current.form;
    Wanted wanted;
    std::vector<std::string> staying;
    for (const std::string& key : writableKeys(form)) {
        if (settings.contains(key)) {
            wanted.settings.set(key, settings.get(key));
        } else if (current.state.settings.contains(key)) {
            staying.push_back(key);
        }
    }
    wanted.lookUp = true;
    const bool changes = !planOf(form, wanted, current.state).changes.empty();
    const ExitStatus status = carryOut(context, wanted, current);
    for (const DescribedKey& key : form.secrets()) {
        if (changes && settings.contains(form.nameOf(key))) {
            context.err << form.settingsSection() << '.' << form.nameOf(key)
                        << ": not restored, a stored secret cannot be written back\n";
        }
    }
    for (const std::string& key : staying) {
        context.err << "adminhostctl: " << form.settingsSection() << '.' << key
                    << ": not set at that time; it cannot be removed and stays "
                    << valueText(current.state.settings.get(key), "(not set)") << '\n';
    }
    return status == ExitStatus::done && !staying.empty() ? ExitStatus::failed : status;
}

}  // namespace adminhost::ctl
