#include "adminhostctl/desired/LookingBack.h"

#include "adminhostctl/Connection.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/Writing.h"
#include "platform/value/ValueText.h"

#include <algorithm>

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

std::string settingText(const Value& value) {
    if (const auto boolean = value.boolean()) {
        return *boolean ? "yes" : "no";
    }
    return value.isNull() ? "not set" : shown(textOf(value));
}

/// The plug-in's history, oldest first.
Array entriesOf(const Context& context, const CommandRef& write) {
    const Value answer = context.service.get("/v1/" + Connection::escaped(write.plugin) + "/history");
    const Array* entries = answer.dictionary() == nullptr ? nullptr : answer.dictionary()->get("history").array();
    return entries == nullptr ? Array{} : *entries;
}

const Dictionary& dictionaryAt(const Dictionary& dictionary, std::string_view key) {
    static const Dictionary none;
    const Dictionary* found = dictionary.get(key).dictionary();
    return found == nullptr ? none : *found;
}

/// The changes of the write, as recorded by the daemon.
std::string changesText(const Dictionary& entry) {
    const Array* changes = entry.get("changes").array();
    if (changes == nullptr) {
        return "unknown: the write did not end";
    }
    std::string text;
    for (const Value& element : *changes) {
        if (const Dictionary* change = element.dictionary()) {
            text += (text.empty() ? "" : "; ") + shown(textOf(change->get("key"))) + ": " +
                    settingText(change->get("from")) + " -> " + settingText(change->get("to"));
        }
    }
    return text.empty() ? "no setting" : text;
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
        context.out << "No settings have been written yet.\n";
        return ExitStatus::done;
    }
    Table table({"number", "when", "who", "changed"});
    // The newest first: that is the one that people look for.
    for (std::size_t i = entries.size(); i-- > 0;) {
        const Dictionary& entry = *entries[i].dictionary();
        const auto when = entry.get("when").date();
        table.addRow({textOf(entry.get("number")), when ? dateText(*when) : "", shown(textOf(entry.get("who"))),
                      changesText(entry)});
    }
    context.out << table.text(context.options.width, 0)
                << "\nadminhostctl rollback NUMBER restores the settings as they were before that write.\n";
    return ExitStatus::done;
}

ExitStatus rollback(const Context& context, std::span<const std::string> arguments) {
    const CommandRef write = context.service.stateCommand("write");
    const Array entries = entriesOf(context, write);
    const auto found = std::find_if(entries.begin(), entries.end(), [&](const Value& entry) {
        return textOf(entry.dictionary()->get("number")) == arguments.front();
    });
    if (found == entries.end()) {
        throw usageError("history entry not found: " + arguments.front() + "; \"adminhostctl history\" lists them");
    }
    const Dictionary& settings = dictionaryAt(*found->dictionary(), "settings");
    const CurrentState current = readState(context);
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
                    << settingText(current.state.settings.get(key)) << '\n';
    }
    return status == ExitStatus::done && !staying.empty() ? ExitStatus::failed : status;
}

}  // namespace adminhost::ctl
