#include "adminhostctl/desired/DesiredVerbs.h"

#include "adminhostctl/OutputFile.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/desired/DesiredFile.h"
#include "adminhostctl/desired/LookingBack.h"
#include "adminhostctl/desired/Writing.h"

#include <array>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

/// What the file, and the password file, ask for.
Wanted wantedOf(const Context& context, const std::string& file, const State& state) {
    const CommandRef command = context.service.command("writeSettings");
    Wanted wanted = parseDesired(context.sources.read(file), file, command.description, state);
    if (!context.options.passwordFile.empty()) {
        DescribedKey key;
        key.path = passwordKey;
        key.secret = true;
        wanted.password = textOfWord(key, '@' + context.options.passwordFile, context.sources);
    }
    return wanted;
}

ExitStatus settingsGet(const Context& context, Words arguments) {
    const CommandRef command = context.service.command("readSettings");
    const Dictionary settings = readState(context).state.settings;
    if (arguments.empty()) {
        writeValue(context, settings, command.description, "configuration");
        return ExitStatus::done;
    }
    const std::string& key = arguments.front();
    if (key == passwordKey) {
        throw usageError("the password is never answered; nimbo_client_password_is_set says whether there is one");
    }
    const Value& value = settings.get(key);
    if (!value.isNull()) {
        writeValue(context, value, command.description, "configuration." + key);
        return ExitStatus::done;
    }
    if (command.description.answerKey("configuration." + key) == nullptr) {
        throw usageError("there is no setting " + shown(key) + "; \"adminhostctl settings get\" shows them");
    }
    throw Failure(ExitStatus::answeredError, shown(key) + " is not set");
}

ExitStatus settingsSet(const Context& context, Words arguments) {
    const CommandRef command = context.service.command("writeSettings");
    const std::string& name = arguments.front();
    const DescribedKey* described = settingKey(command.description, name);
    if (described == nullptr && name != passwordKey) {
        throw usageError("there is no setting " + shown(name) + " that can be written; \"adminhostctl help " +
                         "writeSettings\" lists them below configuration");
    }
    DescribedKey key = described != nullptr ? *described : DescribedKey();
    key.path = name;
    key.secret = key.secret || name == passwordKey;
    Wanted wanted;
    if (key.secret) {
        wanted.password = textOfWord(key, wordAt(arguments, 1), context.sources);
    } else {
        wanted.settings.set(name, valueOfWord(key, wordAt(arguments, 1), context.sources));
    }
    wanted.lookUpController = true;
    return carryOut(context, wanted, readState(context));
}

ExitStatus exportState(const Context& context, Words arguments) {
    const CommandRef command = context.service.command("writeSettings");
    const std::string text = exportOf(readState(context).state, command.description);
    if (arguments.empty() || arguments.front() == "-") {
        context.out << text;
        return ExitStatus::done;
    }
    writeOutput(arguments.front(), text);
    return ExitStatus::done;
}

ExitStatus planFile(const Context& context, Words arguments) {
    const State state = readState(context).state;
    const Wanted wanted = wantedOf(context, arguments.front(), state);
    Plan plan = planOf(wanted, state);
    if (!wanted.password) {
        plan.notes.emplace_back(
            "settings.nimbo_client_password: unknown, it is compared with nothing unless --password-file gives it");
    }
    showPlan(context, plan);
    return ExitStatus::done;
}

ExitStatus applyFile(const Context& context, Words arguments) {
    const CurrentState current = readState(context);
    return carryOut(context, wantedOf(context, arguments.front(), current.state), current);
}

constexpr std::array table = {
    Verb{"settings get", "[KEY]", "The settings, or one of them", 0, 1, &settingsGet},
    Verb{"settings set", "KEY [VALUE|@FILE|@-]", "PlannedChange a setting", 1, 2, &settingsSet},
    Verb{"export", "[FILE]", "Write the settings, properties and access lists down as TOML", 0, 1, &exportState},
    Verb{"plan", "FILE [--password-file FILE]", "What applying the file would change", 1, 1, &planFile},
    Verb{"apply", "FILE [--password-file FILE]", "PlannedChange what differs from the file", 1, 1, &applyFile},
    Verb{"history", "", "The latest writes of settings: when, who and what changed", 0, 0, &history},
    Verb{"rollback", "NUMBER", "Restores the settings as they were before a write of the history", 1, 1, &rollback},
};

}  // namespace

std::span<const Verb> desiredVerbs() noexcept {
    return table;
}

}  // namespace adminhost::ctl
