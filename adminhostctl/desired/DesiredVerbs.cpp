#include "adminhostctl/desired/DesiredVerbs.h"

#include "adminhostctl/Complete.h"
#include "adminhostctl/Connection.h"
#include "adminhostctl/OutputFile.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/DesiredFile.h"
#include "adminhostctl/desired/Explain.h"
#include "adminhostctl/desired/LookingBack.h"
#include "adminhostctl/desired/Trial.h"
#include "adminhostctl/desired/Writing.h"

#include <array>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

constexpr std::string_view validateOption = "--validate";

/// The desired state from the file and the password file.
Wanted wantedOf(const Context& context, const std::string& file, const CurrentState& current) {
    requireWhole(current);
    Wanted wanted = parseDesired(context.sources.read(file), file, current.form, current.state, context.sources.force);
    if (const std::string passwordFile = context.options.argumentOf(passwordFileOption); !passwordFile.empty()) {
        if (current.form.secrets().size() != 1) {
            throw usageError("--password-file: the service has " + std::to_string(current.form.secrets().size()) +
                             " secret settings; use \"settings set\"");
        }
        const DescribedKey& key = current.form.secrets().front();
        wanted.secrets[current.form.nameOf(key)] = textOfWord(key, '@' + passwordFile, context.sources);
    }
    return wanted;
}

/// The settings that can be written, and those of the dictionary.
std::vector<std::string> settingNames(const StateForm& form, const Dictionary& others) {
    std::vector<std::string> names;
    for (const std::vector<DescribedKey>* keys : {&form.settings(), &form.secrets()}) {
        for (const DescribedKey& key : *keys) {
            names.push_back(form.nameOf(key));
        }
    }
    for (const DictionaryEntry& entry : others) {
        names.push_back(entry.key);
    }
    return names;
}

ExitStatus settingsGet(const Context& context, Words arguments) {
    const CommandRef command = context.service.stateCommand("read");
    const StateForm form(context.service.stateCommand("write").description);
    if (!arguments.empty()) {
        if (const DescribedKey* secret = form.secret(arguments.front())) {
            throw usageError(arguments.front() + ": a secret is never returned; \"settings get " + secret->shownBy +
                             "\" shows whether it is set");
        }
    }
    const Dictionary settings = readSettings(context).state.settings;
    if (arguments.empty()) {
        writeValue(context, settings, command.description, form.root());
        return ExitStatus::done;
    }
    const std::string& key = arguments.front();
    const Value& value = settings.get(key);
    if (!value.isNull()) {
        writeValue(context, value, command.description, form.root() + '.' + key);
        return ExitStatus::done;
    }
    if (command.description.answerKey(form.root() + '.' + key) == nullptr) {
        throw usageError("setting not found: " + key + didYouMean(key, settingNames(form, settings)) +
                         "; \"adminhostctl settings get\" lists them");
    }
    throw Failure(ExitStatus::failed, key + " is not set");
}

ExitStatus settingsSet(const Context& context, Words arguments) {
    const StateForm form(context.service.stateCommand("write").description);
    const std::string& name = arguments.front();
    const DescribedKey* secret = form.secret(name);
    const DescribedKey* described = secret != nullptr ? secret : form.setting(name);
    if (described == nullptr) {
        throw usageError("not a setting that can be written: " + name + didYouMean(name, settingNames(form, {})) +
                         "; \"adminhostctl help " + form.command() + "\" lists them below " + form.root());
    }
    DescribedKey key = *described;
    key.path = name;
    Wanted wanted;
    if (secret != nullptr) {
        wanted.secrets[name] = textOfWord(key, wordAt(arguments, 1), context.sources);
    } else {
        wanted.settings.set(name, valueOfWord(key, wordAt(arguments, 1), context.sources));
    }
    wanted.lookUp = true;
    const CurrentState current = readSettings(context);
    if (context.options.has(validateOption) && !passTrials(context, wanted, current)) {
        throw Failure(ExitStatus::failed, "nothing was written, because the setting failed a trial");
    }
    return carryOut(context, wanted, current, Retry::ifUnchanged);
}

ExitStatus exportState(const Context& context, Words arguments) {
    const CurrentState current = readState(context);
    requireWhole(current);
    const std::string text = exportOf(current.form, current.state);
    if (arguments.empty() || arguments.front() == "-") {
        context.out << text;
        return ExitStatus::done;
    }
    writeOutput(arguments.front(), text);
    return ExitStatus::done;
}

ExitStatus planFile(const Context& context, Words arguments) {
    const CurrentState current = readState(context);
    const Wanted wanted = wantedOf(context, arguments.front(), current);
    Plan plan = planOf(current.form, wanted, current.state);
    for (const DescribedKey& key : current.form.secrets()) {
        if (wanted.secrets.count(current.form.nameOf(key)) == 0) {
            plan.notes.push_back(current.form.settingsSection() + '.' + current.form.nameOf(key) +
                                 ": unknown and not compared; --password-file gives it");
        }
    }
    return showOnly(context, current, plan);
}

ExitStatus applyFile(const Context& context, Words arguments) {
    const CurrentState current = readState(context);
    return carryOut(context, wantedOf(context, arguments.front(), current), current);
}

// Completion

/// All settings.
std::vector<std::string> settingsAnd(const Context& context, Words before) {
    if (!before.empty()) {
        return {};
    }
    const StateForm form(context.service.stateCommand("write").description);
    std::vector<std::string> names;
    const CommandRef read = context.service.stateCommand("read");
    for (const DescribedKey& key : read.description.answerKeys()) {
        if (key.path.starts_with(form.root() + '.') && key.path.find('[') == std::string::npos && key.type != "list") {
            names.push_back(key.path.substr(form.root().size() + 1));
        }
    }
    return names;
}

/// The settings that can be written, then the values that one may have.
std::vector<std::string> writableSettings(const Context& context, Words before) {
    const StateForm form(context.service.stateCommand("write").description);
    if (before.empty()) {
        return settingNames(form, {});
    }
    const DescribedKey* key = form.setting(before.front());
    return key == nullptr ? std::vector<std::string>() : valuesOf(*key);
}

std::vector<std::string> historyNumbers(const Context& context, Words) {
    const std::string plugin = context.service.stateCommand("write").plugin;
    return textsOf(context.service.get("/v1/" + Connection::escaped(plugin) + "/history"), "history", "number");
}

constexpr std::array table = {
    Verb{"settings get",
         "[KEY]",
         "Show the settings, or one of them",
         0,
         1,
         &settingsGet,
         {{"settings get", "settings get server_port"}},
         &settingsAnd},
    Verb{"explain",
         "KEY",
         "Explain a setting: unit, range, default, restart, last change",
         1,
         1,
         &explain,
         {{"explain server_port", "--format json explain shared_filesystem"}},
         &settingsAnd},
    Verb{"settings set",
         "KEY [VALUE|@FILE|@-] [--clear] [--force] [--dry-run] [--validate [--password-file FILE]]",
         "Change a setting",
         1,
         2,
         &settingsSet,
         {{"settings set server_port 8170", "settings set nimbo_client_password @password.txt --validate"}},
         &writableSettings},
    Verb{"export",
         "[FILE]",
         "Write settings and lists to a TOML file",
         0,
         1,
         &exportState,
         {{"export", "export host.toml"}}},
    Verb{"plan",
         "FILE [--password-file FILE] [--force]",
         "Show what applying the file would change",
         1,
         1,
         &planFile,
         {{"plan host.toml", "plan host.toml --password-file grid.txt"}}},
    Verb{"apply",
         "FILE [--password-file FILE] [--force] [--dry-run]",
         "Change what differs from the file",
         1,
         1,
         &applyFile,
         {{"apply host.toml", "apply host.toml --password-file grid.txt"}}},
    Verb{"history",
         "[--since TIME] [--user NAME] [--key KEY]",
         "List the latest changes: when, who and what was changed",
         0,
         0,
         &history,
         {{"history --since yesterday", "--format json history --user anna --key server_port"}}},
    Verb{"rollback",
         "NUMBER [--dry-run]",
         "Restore what a change of the history has changed",
         1,
         1,
         &rollback,
         {{"rollback 7", "rollback 7 --dry-run"}},
         &historyNumbers},
};

constexpr std::array options = {
    VerbOption{passwordFileOption, "FILE",
               "Read a password from a file; - asks, or reads standard input. With plan, apply and settings set "
               "--validate the grid account's, with account create the directory administrator's"},
    VerbOption{validateOption, "", "With settings set: try the setting before it is written"},
};

}  // namespace

std::span<const Verb> desiredVerbs() noexcept {
    return table;
}
std::span<const VerbOption> desiredOptions() noexcept {
    return options;
}

}  // namespace adminhost::ctl
