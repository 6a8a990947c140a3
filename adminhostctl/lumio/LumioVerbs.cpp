#include "adminhostctl/lumio/LumioVerbs.h"

#include "adminhostctl/Width.h"
#include "adminhostctl/desired/State.h"
#include "adminhostctl/desired/Toml.h"
#include "adminhostctl/desired/Writing.h"

#include <array>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

constexpr const char* cameras = "cameras";
constexpr const char* properties = "properties";

constexpr std::string_view groupOption = "--group";
constexpr std::string_view protectOption = "--protect";
constexpr std::string_view noProtectOption = "--no-protect";

/// The list under the key of the command's answer. Throws Failure when the command returns an error.
Array listOf(const Context& context, const CommandRef& command, const std::string& key) {
    const CommandAnswer answer = context.service.ask(command, {});
    const Dictionary* said = answer.value ? answer.value->dictionary() : nullptr;
    if (said == nullptr) {
        throw Failure(ExitStatus::failed, "the service did not return a dictionary");
    }
    const std::string error = errorOf(command.description, *said);
    const Array* list = said->get(key).array();
    if (!error.empty() || list == nullptr) {
        throw Failure(ExitStatus::failed, "the service does not list its " + key +
                                              ": its database is missing or cannot be read" +
                                              (error.empty() ? "" : " (" + error + ")"));
    }
    return *list;
}

ExitStatus list(const Context& context, const std::string& name, const std::string& key) {
    const CommandRef command = context.service.command(name);
    const Array all = listOf(context, command, key);
    if (!context.options.names) {
        writeValue(context, all, command.description, key);
        return ExitStatus::done;
    }
    for (const Value& element : all) {
        const std::string* text =
            element.dictionary() != nullptr ? element.dictionary()->get("name").string() : nullptr;
        context.out << (text != nullptr ? shown(*text) + '\n' : "");
    }
    return ExitStatus::done;
}

Failure notFound(const std::string& kind, const std::string& name) {
    return usageError(kind + " not found: " + name + "; \"adminhostctl " + kind + " list\" shows the names");
}

ExitStatus cameraList(const Context& context, Words) {
    return list(context, "getCameras", cameras);
}
ExitStatus propertyList(const Context& context, Words) {
    return list(context, "getProperties", properties);
}

ExitStatus cameraShow(const Context& context, Words words) {
    const CommandRef command = context.service.command("getCameras");
    const Array all = listOf(context, command, cameras);
    const StateForm form(context.service.stateCommand("write").description);
    const State state = stateOf(form, {{cameras, all}});
    const Element* camera = findElement(state, form.list(cameras), words.front());
    if (camera == nullptr) {
        throw notFound("camera", words.front());
    }
    for (const Value& element : all) {
        if (element.dictionary() != nullptr && element.dictionary()->get("_id_") == Value(camera->identity)) {
            writeValue(context, element, command.description, std::string(cameras) + "[]");
        }
    }
    return ExitStatus::done;
}

/// Changes one camera, which must exist.
ExitStatus changeCamera(const Context& context, WantedElement camera) {
    const CurrentState current = readState(context);
    requireWhole(current);
    if (findElement(current.state, current.form.list(cameras), camera.name) == nullptr) {
        throw notFound("camera", camera.name);
    }
    Wanted wanted;
    wanted.elements[cameras].push_back(std::move(camera));
    return carryOut(context, wanted, current);
}

WantedElement wantedOf(const std::string& name) {
    return {name, {}, {}, {}, false, false};
}

ExitStatus cameraAllow(const Context& context, Words arguments) {
    WantedElement camera = wantedOf(arguments.front());
    camera.lists[context.options.has(groupOption) ? "groups" : "users"] =
        std::vector<std::string>(arguments.begin() + 1, arguments.end());
    return changeCamera(context, std::move(camera));
}

ExitStatus cameraDeny(const Context& context, Words arguments) {
    WantedElement camera = wantedOf(arguments.front());
    for (const std::string& name : arguments.subspan(1)) {
        camera.denied.push_back({context.options.has(groupOption) ? "group" : "", name, ""});
    }
    return changeCamera(context, std::move(camera));
}

ExitStatus cameraAccess(const Context& context, Words arguments) {
    if (arguments[1] != "on" && arguments[1] != "off") {
        throw usageError("camera access: \"" + arguments[1] + "\" is neither on nor off");
    }
    WantedElement camera = wantedOf(arguments.front());
    camera.fields.set("access_control_enabled", arguments[1] == "on");
    return changeCamera(context, std::move(camera));
}

ExitStatus cameraRemove(const Context& context, Words arguments) {
    WantedElement camera = wantedOf(arguments.front());
    camera.remove = true;
    return changeCamera(context, std::move(camera));
}

ExitStatus changeProperty(const Context& context, WantedElement property, const CurrentState& current) {
    Wanted wanted;
    wanted.elements[properties].push_back(std::move(property));
    return carryOut(context, wanted, current);
}

ExitStatus propertySet(const Context& context, Words arguments) {
    const CurrentState current = readState(context);
    const ListForm& list = current.form.list(properties);
    const Element* stored = findElement(current.state, list, arguments.front());
    WantedElement property = wantedOf(arguments.front());
    property.writeSecret = true;
    const bool isProtected = stored != nullptr && stored->fields.get("protect") == Value(true);
    const bool protects = context.options.has(protectOption);
    const bool isGiven = protects || context.options.has(noProtectOption);
    const bool becomes = isGiven ? protects : isProtected;
    if (isGiven) {
        property.fields.set("protect", becomes);
    }
    // Without a value, the stored value is kept and only its protection changes.
    if (arguments.size() > 1 || stored == nullptr || becomes == isProtected) {
        DescribedKey key;
        key.path = "the value of " + tomlText(arguments.front());
        key.type = "text";
        key.secret = becomes;
        property.fields.set("value", textOfWord(key, wordAt(arguments, 1), context.sources));
    }
    return changeProperty(context, std::move(property), current);
}

ExitStatus propertyRemove(const Context& context, Words arguments) {
    const CurrentState current = readState(context);
    if (findElement(current.state, current.form.list(properties), arguments.front()) == nullptr) {
        throw notFound("property", arguments.front());
    }
    WantedElement property = wantedOf(arguments.front());
    property.remove = true;
    return changeProperty(context, std::move(property), current);
}

constexpr std::array table = {
    Verb{"camera list", "[--names]", "List the cameras and who may use them", 0, 0, &cameraList},
    Verb{"camera show", "NAME|UUID", "Show everything about a camera", 1, 1, &cameraShow},
    Verb{"camera allow", "CAMERA NAME... [--group]", "Allow users, or groups, to use a camera", 2, 1000, &cameraAllow},
    Verb{"camera deny", "CAMERA NAME... [--group]", "Remove users and groups from a camera's list", 2, 1000,
         &cameraDeny},
    Verb{"camera access", "CAMERA on|off", "Restrict a camera to its list, or open it to everyone", 2, 2,
         &cameraAccess},
    Verb{"camera remove", "CAMERA", "Remove a camera from the service", 1, 1, &cameraRemove},
    Verb{"property list", "[--names]", "List the workflow properties", 0, 0, &propertyList},
    Verb{"property set", "NAME [VALUE|@FILE|@-] [--protect|--no-protect]", "Add or change a property", 1, 2,
         &propertySet},
    Verb{"property remove", "NAME", "Remove a property", 1, 1, &propertyRemove},
};

constexpr std::array options = {
    VerbOption{groupOption, "", "With camera allow and camera deny: the names are names of groups"},
    VerbOption{protectOption, "", "With property set: store the value encrypted"},
    VerbOption{noProtectOption, "", "With property set: store the value unencrypted", protectOption},
};

}  // namespace

std::span<const Verb> lumioVerbs() noexcept {
    return table;
}
std::span<const VerbOption> lumioOptions() noexcept {
    return options;
}

}  // namespace adminhost::ctl
