#include "adminhostctl/ChangeVerbs.h"

#include "adminhostctl/DesiredFile.h"
#include "adminhostctl/OutputFile.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/Toml.h"
#include "adminhostctl/Width.h"
#include "adminhostctl/Writing.h"

#include <algorithm>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

std::optional<std::string> second(Words arguments) {
    return arguments.size() > 1 ? std::optional(arguments[1]) : std::nullopt;
}

std::string textOfWord(const KeyDescription& key, const std::optional<std::string>& word, const Sources& sources) {
    const Value value = valueOfWord(key, word, sources);
    return value.string() != nullptr ? *value.string() : std::string();
}

/// What the file, and the password file, ask for.
Wanted wantedOf(const Context& context, const std::string& file, const State& state) {
    const CommandRef command = context.service.command("writeSettings");
    Wanted wanted = parseDesired(context.sources.read(file), file, command.description, state);
    if (!context.options.passwordFile.empty()) {
        KeyDescription key;
        key.path = passwordKey;
        key.secret = true;
        wanted.password = textOfWord(key, '@' + context.options.passwordFile, context.sources);
    }
    return wanted;
}

ExitStatus changeCamera(const Context& context, WantedCamera camera) {
    Wanted wanted;
    wanted.cameras.push_back(std::move(camera));
    return carryOut(context, wanted, readState(context));
}

}  // namespace

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
    const KeyDescription* described = settingKey(command.description, name);
    if (described == nullptr && name != passwordKey) {
        throw usageError("there is no setting " + shown(name) + " that can be written; \"adminhostctl help " +
                         "writeSettings\" lists them below configuration");
    }
    KeyDescription key = described != nullptr ? *described : KeyDescription();
    key.path = name;
    key.secret = key.secret || name == passwordKey;
    Wanted wanted;
    if (key.secret) {
        wanted.password = textOfWord(key, second(arguments), context.sources);
    } else {
        wanted.settings.set(name, valueOfWord(key, second(arguments), context.sources));
    }
    wanted.lookUpController = true;
    return carryOut(context, wanted, readState(context));
}

ExitStatus propertySet(const Context& context, Words arguments) {
    const CurrentState current = readState(context);
    const std::string& name = arguments.front();
    const Property* stored = findProperty(current.state, name);
    WantedProperty property{name, std::nullopt, context.options.isProtected, false, true};
    const bool isProtected = stored != nullptr && stored->isProtected;
    const bool switches = stored != nullptr && property.isProtected && property.isProtected != isProtected;
    if (arguments.size() > 1 || !switches) {
        KeyDescription key;
        key.path = "the value of " + tomlText(name);
        key.type = "text";
        key.secret = property.isProtected.value_or(isProtected);
        property.value = textOfWord(key, second(arguments), context.sources);
    }
    Wanted wanted;
    wanted.properties.push_back(std::move(property));
    return carryOut(context, wanted, current);
}

ExitStatus propertyRemove(const Context& context, Words arguments) {
    const CurrentState current = readState(context);
    if (findProperty(current.state, arguments.front()) == nullptr) {
        throw usageError("there is no property " + tomlText(arguments.front()));
    }
    Wanted wanted;
    wanted.properties.push_back({arguments.front(), std::nullopt, std::nullopt, true, false});
    return carryOut(context, wanted, current);
}

ExitStatus cameraAllow(const Context& context, Words arguments) {
    WantedCamera camera{arguments.front(), {}, {}, {}, {}, false};
    (context.options.group ? camera.groups : camera.users) =
        std::vector<std::string>(arguments.begin() + 1, arguments.end());
    return changeCamera(context, std::move(camera));
}

ExitStatus cameraDeny(const Context& context, Words arguments) {
    WantedCamera camera{arguments.front(), {}, {}, {}, {}, false};
    for (const std::string& name : arguments.subspan(1)) {
        camera.denied.push_back({context.options.group ? "group" : "", name, ""});
    }
    return changeCamera(context, std::move(camera));
}

ExitStatus cameraAccess(const Context& context, Words arguments) {
    if (arguments[1] != "on" && arguments[1] != "off") {
        throw usageError("write adminhostctl camera access CAMERA on, or off");
    }
    return changeCamera(context, {arguments.front(), arguments[1] == "on", {}, {}, {}, false});
}

ExitStatus cameraRemove(const Context& context, Words arguments) {
    return changeCamera(context, {arguments.front(), {}, {}, {}, {}, true});
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

}  // namespace adminhost::ctl
