#include "adminhostctl/lumio/LumioVerbs.h"

#include "adminhostctl/Width.h"
#include "adminhostctl/desired/State.h"
#include "adminhostctl/desired/Toml.h"
#include "adminhostctl/desired/Writing.h"
#include "platform/value/ValueText.h"

#include <array>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

// Lists of the service

/// The list under the key of the command's answer. When the command answers an error, says so and answers null.
Value listOf(const Context& context, const CommandRef& command, const std::string& key) {
    const auto answer = context.service.perform(command, {});
    if (!answer || answer->dictionary() == nullptr) {
        static_cast<void>(reportAnswered(context, "it answered no dictionary"));
        return {};
    }
    std::string error = errorOf(command.description, *answer->dictionary());
    const Value& list = answer->dictionary()->get(key);
    if (error.empty() && list.array() == nullptr) {
        error = key + " is missing";
    }
    return reportAnswered(context, error) == ExitStatus::done ? list : Value();
}

ExitStatus list(const Context& context, const std::string& name, const std::string& key) {
    const CommandRef command = context.service.command(name);
    const Value all = listOf(context, command, key);
    if (all.isNull()) {
        return ExitStatus::answeredError;
    }
    if (!context.options.names) {
        writeValue(context, all, command.description, key);
        return ExitStatus::done;
    }
    for (const Value& element : *all.array()) {
        const std::string* text =
            element.dictionary() != nullptr ? element.dictionary()->get("name").string() : nullptr;
        context.out << (text != nullptr ? shown(*text) + '\n' : "");
    }
    return ExitStatus::done;
}

/// Shows the one element of a list that has the name or, in any case, the UUID.
ExitStatus show(const Context& context, const std::string& name, const std::string& key, const std::string& wanted) {
    const CommandRef command = context.service.command(name);
    const Value all = listOf(context, command, key);
    if (all.isNull()) {
        return ExitStatus::answeredError;
    }
    Array named;
    for (const Value& element : *all.array()) {
        const Dictionary* dictionary = element.dictionary();
        const std::string* uuid = dictionary != nullptr ? dictionary->get("uuid").string() : nullptr;
        if (uuid != nullptr && sameUuid(*uuid, wanted)) {
            named = {element};
            break;
        }
        if (dictionary != nullptr && dictionary->get("name") == Value(wanted)) {
            named.push_back(element);
        }
    }
    if (named.empty()) {
        throw Failure(ExitStatus::answeredError, "there is none with the name or UUID " + shown(wanted));
    }
    if (named.size() > 1) {
        std::string uuids;
        for (const Value& element : named) {
            uuids += "\n  " + shown(textOf(element.dictionary()->get("uuid")));
        }
        throw usageError("several have the name " + shown(wanted) + "; give one of their UUIDs:" + uuids);
    }
    writeValue(context, named.front(), command.description, key + "[]");
    return ExitStatus::done;
}

ExitStatus cameraList(const Context& context, Words) {
    return list(context, "getCameras", "cameras");
}
ExitStatus cameraShow(const Context& context, Words words) {
    return show(context, "getCameras", "cameras", words.front());
}
ExitStatus propertyList(const Context& context, Words) {
    return list(context, "getProperties", "properties");
}

ExitStatus changeCamera(const Context& context, WantedCamera camera) {
    Wanted wanted;
    wanted.cameras.push_back(std::move(camera));
    return carryOut(context, wanted, readState(context));
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

ExitStatus propertySet(const Context& context, Words arguments) {
    const CurrentState current = readState(context);
    const std::string& name = arguments.front();
    const ListedProperty* stored = findProperty(current.state, name);
    WantedProperty property{name, std::nullopt, context.options.isProtected, false, true};
    const bool isProtected = stored != nullptr && stored->isProtected;
    const bool switches = stored != nullptr && property.isProtected && property.isProtected != isProtected;
    if (arguments.size() > 1 || !switches) {
        DescribedKey key;
        key.path = "the value of " + tomlText(name);
        key.type = "text";
        key.secret = property.isProtected.value_or(isProtected);
        property.value = textOfWord(key, wordAt(arguments, 1), context.sources);
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

constexpr std::array table = {
    Verb{"camera list", "[--names]", "The cameras and who may use them", 0, 0, &cameraList},
    Verb{"camera show", "NAME|UUID", "Everything about one camera", 1, 1, &cameraShow},
    Verb{"camera allow", "CAMERA NAME... [--group]", "Let users, or groups, use a camera", 2, 1000, &cameraAllow},
    Verb{"camera deny", "CAMERA NAME... [--group]", "Take users and groups from a camera's list", 2, 1000, &cameraDeny},
    Verb{"camera access", "CAMERA on|off", "Whether only those of its list may use a camera", 2, 2, &cameraAccess},
    Verb{"camera remove", "CAMERA", "Remove a camera from the service", 1, 1, &cameraRemove},
    Verb{"property list", "[--names]", "The workflow properties", 0, 0, &propertyList},
    Verb{"property set", "NAME [VALUE|@FILE|@-] [--protect|--no-protect]", "Add or change a property", 1, 2,
         &propertySet},
    Verb{"property remove", "NAME", "Remove a property", 1, 1, &propertyRemove},
};

}  // namespace

std::span<const Verb> lumioVerbs() noexcept {
    return table;
}

}  // namespace adminhost::ctl
