#include "adminhostctl/desired/DesiredVerbs.h"

#include "adminhostctl/Complete.h"
#include "adminhostctl/OutputFile.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/DesiredFile.h"
#include "adminhostctl/desired/Explain.h"
#include "adminhostctl/desired/ExportedFile.h"
#include "adminhostctl/desired/KnownPeople.h"
#include "adminhostctl/desired/LookingBack.h"
#include "adminhostctl/desired/Trial.h"
#include "adminhostctl/desired/Writing.h"

#include <algorithm>
#include <array>
#include <set>
#include <sstream>

#include <fmt/format.h>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

constexpr std::string_view validateOption = "--validate";
constexpr std::string_view onlyOption = "--only";
constexpr std::string_view exitCodeOption = "--exit-code";
constexpr std::size_t mostFiles = 100;

/// The sections of --only; empty without it.
std::set<std::string> chosenSections(const Context& context, const StateForm& form) {
    std::vector<std::string> known{form.settingsSection()};
    for (const ListForm& list : form.lists()) {
        known.push_back(list.section);
    }
    std::set<std::string> chosen;
    std::istringstream words(context.options.argumentOf(onlyOption));
    for (std::string word; std::getline(words, word, ',');) {
        if (std::find(known.begin(), known.end(), word) == known.end()) {
            throw usageError(fmt::format("--only: not a section: {}{}; the sections are {}", word,
                                         didYouMean(word, known), fmt::join(known, ", ")));
        }
        chosen.insert(word);
    }
    if (chosen.empty() && context.options.has(onlyOption)) {
        throw usageError("--only: the name of a section is missing");
    }
    return chosen;
}

/// The state that the files are compared with: a single section if they concern only that one.
CurrentState readChosenState(const Context& context) {
    const std::set<std::string> chosen =
        chosenSections(context, StateForm(context.service.stateCommand("write").description));
    CurrentState current = readState(context, chosen.size() == 1 ? *chosen.begin() : std::string());
    // Settings alone are read from their files, whatever the database has.
    if (chosen != std::set<std::string>{current.form.settingsSection()}) {
        requireWhole(current);
    }
    return current;
}

/// The desired state from the files and the password file. Nothing has been written when it throws Failure.
Wanted wantedOf(const Context& context, Words paths, const CurrentState& current) {
    const StateForm& form = current.form;
    DesiredFiles files(form, current.state, {.force = context.sources.force, .only = chosenSections(context, form)});
    for (const std::string& path : paths) {
        files.add(context.sources.read(path), path);
    }
    Wanted wanted = files.wanted();
    if (const std::string passwordFile = context.options.argumentOf(passwordFileOption); !passwordFile.empty()) {
        if (form.secrets().size() != 1) {
            throw usageError("--password-file: the service has " + std::to_string(form.secrets().size()) +
                             " secret settings; use \"settings set\"");
        }
        if (!wanted.only.empty() && !wanted.only.contains(form.settingsSection())) {
            throw usageError("--password-file: the password is a setting, and --only leaves out the " +
                             form.settingsSection());
        }
        const DescribedKey& key = form.secrets().front();
        wanted.secrets[form.nameOf(key)] = textOfWord(key, '@' + passwordFile, context.sources);
    }
    requireKnownPeople(context, form, wanted, current.state);
    return wanted;
}

/// Adds a note on each secret that the files do not have although they have settings that are used together with it.
void addSecretNotes(const Context& context, Plan& plan, const Wanted& wanted, const StateForm& form) {
    for (const DescribedKey& key : form.secrets()) {
        const std::string name = form.nameOf(key);
        const std::set<std::string> together = settingsTriedWith(context, name);
        const bool isConcerned = std::any_of(wanted.settings.begin(), wanted.settings.end(),
                                             [&](const auto& setting) { return together.contains(setting.key); });
        if (isConcerned && wanted.secrets.count(name) == 0) {
            plan.notes.push_back(form.settingsSection() + '.' + name +
                                 ": unknown and not compared; --password-file gives it");
        }
    }
}

/// The status for scripts: with --exit-code, success with changes differs from success without any.
ExitStatus statusOf(const Context& context, ExitStatus status, bool differs) {
    return status == ExitStatus::done && differs && context.options.has(exitCodeOption) ? ExitStatus::changes : status;
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
    const Dictionary settings = readSettingsSection(context).state.settings;
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
    const CurrentState current = readSettingsSection(context);
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

ExitStatus planFiles(const Context& context, Words arguments) {
    const CurrentState current = readChosenState(context);
    const Wanted wanted = wantedOf(context, arguments, current);
    Plan plan = planOf(current.form, wanted, current.state);
    addSecretNotes(context, plan, wanted, current.form);
    return statusOf(context, showOnly(context, current, plan), !plan.changes.empty());
}

ExitStatus applyFiles(const Context& context, Words arguments) {
    const CurrentState current = readChosenState(context);
    const Wanted wanted = wantedOf(context, arguments, current);
    const bool differs = !planOf(current.form, wanted, current.state).changes.empty();
    return statusOf(context, carryOut(context, wanted, current), differs);
}

// Completion

/// All settings.
std::vector<std::string> settingsAnd(const Context& context, const TypedArguments& typed) {
    if (!typed.before.empty()) {
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
std::vector<std::string> writableSettings(const Context& context, const TypedArguments& typed) {
    const StateForm form(context.service.stateCommand("write").description);
    if (typed.before.empty()) {
        return settingNames(form, {});
    }
    const DescribedKey* key = form.setting(typed.before.front());
    return key == nullptr ? std::vector<std::string>() : valuesOf(*key);
}

std::vector<std::string> historyNumbers(const Context& context, const TypedArguments&) {
    return historyNumbersOf(context);
}

constexpr std::array table = {
    Verb{"settings get", "[KEY]", "Show the settings, or one of them", 0, 1, &settingsGet, {}, &settingsAnd},
    Verb{"explain",
         "KEY",
         "Explain a setting: unit, range, default, restart, last change",
         1,
         1,
         &explain,
         {},
         &settingsAnd},
    Verb{"settings set",
         "KEY [VALUE|@FILE|@-] [--clear] [--force] [--dry-run] [--validate [--password-file FILE]]",
         "Change a setting",
         1,
         2,
         &settingsSet,
         {},
         &writableSettings},
    Verb{"export",
         "[FILE]",
         "Write settings and lists to a TOML file",
         0,
         1,
         &exportState,
         {{"export", "export host.toml"}}},
    Verb{"plan",
         "FILE... [--only SECTIONS] [--password-file FILE] [--force] [--exit-code]",
         "Show what applying the files, of which the later ones win, would change",
         1,
         mostFiles,
         &planFiles,
         {}},
    Verb{"apply",
         "FILE... [--only SECTIONS] [--password-file FILE] [--force] [--dry-run] [--exit-code]",
         "Change what differs from the files, of which the later ones win",
         1,
         mostFiles,
         &applyFiles,
         {{"apply base.toml host2.toml", "apply host.toml --password-file grid.txt"}}},
    Verb{"history",
         "[--since TIME] [--user NAME] [--key KEY]",
         "List the latest changes: when, who and what was changed",
         0,
         0,
         &history,
         {}},
    Verb{"rollback",
         "NUMBER [--dry-run]",
         "Restore the state before a change of the history",
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
    VerbOption{onlyOption, "SECTIONS", "With plan and apply: only these tables of the files, separated by commas"},
    VerbOption{exitCodeOption, "",
               "With plan and apply: exit status 5 if something differs, or was changed; 0 if nothing does"},
    VerbOption{validateOption, "", "Try the setting before it is written"},
};

}  // namespace

std::span<const Verb> desiredVerbs() noexcept {
    return table;
}
std::span<const VerbOption> desiredOptions() noexcept {
    return options;
}

}  // namespace adminhost::ctl
