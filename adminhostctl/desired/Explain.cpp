#include "adminhostctl/desired/Explain.h"

#include "adminhostctl/Age.h"
#include "adminhostctl/Connection.h"
#include "adminhostctl/Help.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/desired/Writing.h"
#include "platform/value/ValueText.h"

#include <chrono>

namespace adminhost::ctl {
namespace {

/// The entry of the history that changed the setting last, and the change; null pointers if there is none.
std::pair<const Dictionary*, const Dictionary*> lastChangeOf(const Array& entries, const std::string& name) {
    for (auto entry = entries.rbegin(); entry != entries.rend(); ++entry) {
        const Array* changes = entry->dictionary() == nullptr ? nullptr : entry->dictionary()->get("changes").array();
        if (changes == nullptr) {
            continue;
        }
        for (const Value& change : *changes) {
            if (change.dictionary() != nullptr && change.dictionary()->get("key") == Value(name)) {
                return {entry->dictionary(), change.dictionary()};
            }
        }
    }
    return {};
}

std::string valueText(const Value& value) {
    return value.isNull() ? "(not set)" : textOf(value);
}

std::string lastChangeText(const Context& context, const CommandRef& write, const std::string& name) {
    const Value answer = context.service.get("/v1/" + Connection::escaped(write.plugin) + "/history");
    const Array* entries = answer.dictionary() == nullptr ? nullptr : answer.dictionary()->get("history").array();
    const auto [entry, change] =
        entries == nullptr ? std::pair<const Dictionary*, const Dictionary*>() : lastChangeOf(*entries, name);
    if (entry == nullptr) {
        return "not in the history";
    }
    const auto when = entry->get("when").date();
    const std::string values = change->get("secret") == Value(true)
                                   ? "(secret)"
                                   : valueText(change->get("from")) + " -> " + valueText(change->get("to"));
    return (when ? dateWithAge(*when, std::chrono::system_clock::now()) + ", " : std::string()) + "by " +
           std::string(entry->text("who")) + ": " + values;
}

std::string rangeText(const DescribedKey& key) {
    if (key.minimum && key.maximum) {
        return std::to_string(*key.minimum) + " to " + std::to_string(*key.maximum);
    }
    return key.minimum   ? std::to_string(*key.minimum) + " or more"
           : key.maximum ? std::to_string(*key.maximum) + " or less"
                         : "";
}

std::string restartText(const DescribedKey& key) {
    std::string text;
    for (const std::string& command : key.restart) {
        text += (text.empty() ? "needed: adminhostctl " : ", then ") + command;
    }
    return text.empty() ? "not needed" : text;
}

}  // namespace

ExitStatus explain(const Context& context, std::span<const std::string> arguments) {
    const CommandRef write = context.service.stateCommand("write");
    const CommandRef read = context.service.stateCommand("read");
    const StateForm form(write.description);
    const std::string& name = arguments.front();
    const DescribedKey* secret = form.secret(name);
    const DescribedKey* written = secret != nullptr ? secret : form.setting(name);
    const DescribedKey* key = written != nullptr ? written : read.description.answerKey(form.root() + '.' + name);
    if (key == nullptr || name.find_first_of(".[") != std::string::npos || key->type == "list") {
        std::vector<std::string> known;
        for (const DescribedKey& one : read.description.answerKeys()) {
            if (one.path.starts_with(form.root() + '.') && one.path.find('[') == std::string::npos) {
                known.push_back(one.path.substr(form.root().size() + 1));
            }
        }
        throw usageError("setting not found: " + name + didYouMean(name, known) +
                         "; \"adminhostctl settings get\" lists them");
    }
    const State state = readSettingsSection(context).state;
    Dictionary all{{"setting", name}, {"meaning", key->help}};
    all.set("type", secret != nullptr ? "text, secret" : typeText(*key));
    const DescribedKey* answered = read.description.answerKey(form.root() + '.' + name);
    if (!key->unit.empty()) {
        all.set("unit", key->unit);
    }
    if (const std::string range = rangeText(*key); !range.empty()) {
        all.set("range", range);
    }
    const Value& initial =
        answered == nullptr || answered->defaultKey.empty() ? Value() : state.settings.get(answered->defaultKey);
    all.set("default", initial.isNull() ? Value("the service's own, while the setting is not set") : initial);
    if (secret != nullptr) {
        all.set("value", booleanOf(state.settings.get(secret->shownBy)) ? "(secret)" : "(not set)");
    } else {
        const Value& value = state.settings.get(name);
        all.set("value", value.isNull() ? Value("(not set)") : value);
    }
    if (secret != nullptr) {
        all.remove("default");  // there is none
    }
    if (written == nullptr) {
        all.remove("default");
        all.set("written", "by the service only");
    } else {
        all.set("restart", restartText(*written));
        all.set("settings file", written->file);
        all.set("last change", lastChangeText(context, write, name));
    }
    writeValue(context, all, Description());
    return ExitStatus::done;
}

}  // namespace adminhost::ctl
