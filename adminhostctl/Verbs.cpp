#include "adminhostctl/Verbs.h"

#include "adminhostctl/ChangeVerbs.h"
#include "adminhostctl/HistoryVerbs.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/State.h"
#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "platform/json/Json.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/Text.h"

#include <algorithm>
#include <array>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

ExitStatus say(const Context& context, const std::string& error) {
    if (error.empty()) {
        return ExitStatus::done;
    }
    context.err << "adminhostctl: the service answered an error: " << error << '\n';
    return ExitStatus::answeredError;
}

// The daemon itself

ExitStatus status(const Context& context, Words) {
    writeValue(context, context.service.overview(), Description());
    return ExitStatus::done;
}

ExitStatus commands(const Context& context, Words) {
    Array all;
    for (const PluginInfo& plugin : context.service.plugins()) {
        for (const Description& command : plugin.commands) {
            all.emplace_back(
                Dictionary{{"command", command.name()}, {"plugin", plugin.name}, {"summary", command.summary()}});
            if (context.options.names) {
                context.out << command.name() << '\n';
            }
        }
    }
    if (!context.options.names) {
        writeValue(context, all, Description());
    }
    return ExitStatus::done;
}

// Help

std::string typeText(const KeyDescription& key) {
    const std::string type = key.enteredAs.empty() ? key.type : key.enteredAs;
    return type == "integer"                   ? "whole number"
           : type == "real"                    ? "number"
           : type == "boolean"                 ? "yes or no"
           : type == "scalar" || type == "any" ? "text"
                                               : type;
}

/// Key paths are long and cannot be broken: each has a line of its own, and its meaning stands below.
std::string keyList(const std::vector<KeyDescription>& keys, std::size_t width) {
    constexpr std::size_t indent = 6;
    std::string text;
    for (const KeyDescription& key : keys) {
        std::string help = key.help;
        for (std::size_t i = 0; i < key.allowed.size(); ++i) {
            help += (i == 0 ? " One of " : ", ") + key.allowed[i] + (i + 1 == key.allowed.size() ? "." : "");
        }
        help += key.required ? " Needed." : "";
        help += key.secret ? " Secret: " + key.path + "@FILE or " + key.path + "@-." : "";
        text += "  " + shown(key.path) + " (" + shown(typeText(key)) + ")\n";
        for (const std::string& line : wrapped(shown(help), width - indent)) {
            text.append(indent, ' ').append(line + '\n');
        }
    }
    return text;
}

void helpOfCommand(const Context& context, const std::string& name) {
    const CommandRef command = context.service.command(name);
    const Description& description = command.description;
    if (context.options.names) {
        for (const KeyDescription& key : description.keys()) {
            context.out << key.path << (key.secret ? "@" : "=") << '\n';
        }
        return;
    }
    context.out << shown(description.name()) << ": " << shown(description.summary()) << "\n\n";
    for (const std::string& line : wrapped(shown(description.text()), context.options.width)) {
        context.out << line << '\n';
    }
    context.out << "\nadminhostctl " << shown(description.name())
                << " [KEY=TEXT | KEY:=JSON | KEY@FILE | KEY@-]... [--file FILE|-]\n";
    if (!description.keys().empty()) {
        context.out << "\nKeys:\n" << keyList(description.keys(), context.options.width);
    }
    if (!description.answerKeys().empty()) {
        context.out << "\nAnswer:\n" << keyList(description.answerKeys(), context.options.width);
    }
    if (!description.errors().empty()) {
        context.out << "\nErrors:\n" << Reading(Description(), context.options.width).text(description.errors());
    }
    context.out << "\nExample of a request (as with --file):\n"
                << jsonOf(description.example().get("request"), true) << '\n';
}

ExitStatus help(const Context& context, Words arguments) {
    if (!arguments.empty()) {
        helpOfCommand(context, arguments.front());
        return ExitStatus::done;
    }
    Table table({"verb", "", "meaning"});
    for (const Verb& verb : verbs()) {
        table.addRow({std::string(verb.words), std::string(verb.arguments), std::string(verb.summary)});
    }
    context.out << table.text(context.options.width, 0)
                << "\nEvery other word is a command of the service: adminhostctl commands lists them,\n"
                   "adminhostctl help COMMAND describes one.\n";
    return ExitStatus::done;
}

// Lists of the service

/// The list under the key of the command's answer. When the command answers an error, says so and answers null.
Value listOf(const Context& context, const CommandRef& command, const std::string& key) {
    const auto answer = context.service.perform(command, {});
    if (!answer || answer->dictionary() == nullptr) {
        static_cast<void>(say(context, "it answered no dictionary"));
        return {};
    }
    std::string error = errorOf(command.description, *answer->dictionary());
    const Value& list = answer->dictionary()->get(key);
    if (error.empty() && list.array() == nullptr) {
        error = key + " is missing";
    }
    return say(context, error) == ExitStatus::done ? list : Value();
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

constexpr std::array verbTable = {
    Verb{"status", "", "What the daemon runs now, its plug-ins and how many requests wait", 0, 0, &status},
    Verb{"commands", "[--names]", "The commands, with a sentence each", 0, 0, &commands},
    Verb{"help", "[COMMAND]", "The verbs, or a command's keys and answer", 0, 1, &help},
    Verb{"camera list", "[--names]", "The cameras and who may use them", 0, 0, &cameraList},
    Verb{"camera show", "NAME|UUID", "Everything about one camera", 1, 1, &cameraShow},
    Verb{"camera allow", "CAMERA NAME... [--group]", "Let users, or groups, use a camera", 2, 1000, &cameraAllow},
    Verb{"camera deny", "CAMERA NAME... [--group]", "Take users and groups from a camera's list", 2, 1000, &cameraDeny},
    Verb{"camera access", "CAMERA on|off", "Whether only those of its list may use a camera", 2, 2, &cameraAccess},
    Verb{"camera remove", "CAMERA", "Remove a camera from the service", 1, 1, &cameraRemove},
    Verb{"export", "[FILE]", "Write the settings, properties and access lists down as TOML", 0, 1, &exportState},
    Verb{"plan", "FILE [--password-file FILE]", "What applying the file would change", 1, 1, &planFile},
    Verb{"apply", "FILE [--password-file FILE]", "Change what differs from the file", 1, 1, &applyFile},
    Verb{"whois", "NAME|UUID", "Who has this name or UUID, and which directory knows it", 1, 1, &whois},
    Verb{"history", "", "The latest writes of settings: when, who and what changed", 0, 0, &history},
    Verb{"rollback", "NUMBER", "Restores the settings as they were before a write of the history", 1, 1, &rollback},
    Verb{"property list", "[--names]", "The workflow properties", 0, 0, &propertyList},
    Verb{"property set", "NAME [VALUE|@FILE|@-] [--protect|--no-protect]", "Add or change a property", 1, 2,
         &propertySet},
    Verb{"property remove", "NAME", "Remove a property", 1, 1, &propertyRemove},
    Verb{"settings get", "[KEY]", "The settings, or one of them", 0, 1, &settingsGet},
    Verb{"settings set", "KEY [VALUE|@FILE|@-]", "Change a setting", 1, 2, &settingsSet},
};

ExitStatus perform(const Context& context, Words words) {
    const CommandRef command = context.service.command(words.front());
    Dictionary base;
    if (!context.options.file.empty()) {
        base = parseRequest(context.sources.read(context.options.file), context.options.file);
    }
    const Dictionary request =
        buildRequest(command.description, std::move(base), {words.begin() + 1, words.end()}, context.sources);
    const auto answer = context.service.perform(command, request);
    if (!answer) {
        context.out << (context.options.format == Format::text ? "done\n" : "");
        return ExitStatus::done;
    }
    writeValue(context, *answer, command.description);
    return say(context, answer->dictionary() != nullptr ? errorOf(command.description, *answer->dictionary()) : "");
}

std::vector<std::string> splitWords(std::string_view words) {
    const std::size_t blank = words.find(' ');
    if (blank == std::string_view::npos) {
        return {std::string(words)};
    }
    return {std::string(words.substr(0, blank)), std::string(words.substr(blank + 1))};
}

}  // namespace

void writeValue(const Context& context, const Value& value, const Description& description, const std::string& path) {
    switch (context.options.format) {
        case Format::text:
            context.out << Reading(description, context.options.width).text(value, path);
            break;
        case Format::json:
            context.out << jsonOf(value, true) << '\n';
            break;
        case Format::plist: {
            Error error;
            const auto text = xmlPropertyList(value, &error);
            if (!text) {
                throw Failure(ExitStatus::answeredError, "a property list cannot carry the answer: " + textOf(error));
            }
            context.out << *text;
            break;
        }
    }
}

std::span<const Verb> verbs() noexcept {
    return verbTable;
}

ExitStatus run(const Context& context, const std::vector<std::string>& words) {
    std::string known;
    for (const Verb& verb : verbs()) {
        const std::vector<std::string> own = splitWords(verb.words);
        if (own.front() == words.front()) {
            known += (known.empty() ? "" : ", ") + std::string(verb.words);
        }
        if (own.size() > words.size() || !std::equal(own.begin(), own.end(), words.begin())) {
            continue;
        }
        const Words arguments = Words(words).subspan(own.size());
        if (arguments.size() < verb.least || arguments.size() > verb.most) {
            throw usageError("write adminhostctl " + std::string(verb.words) +
                             (verb.arguments.empty() ? "" : " " + std::string(verb.arguments)));
        }
        return verb.run(context, arguments);
    }
    if (!known.empty()) {
        throw usageError("there are " + known);
    }
    return perform(context, words);
}

}  // namespace adminhost::ctl
