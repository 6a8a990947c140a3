#include "adminhostctl/GeneralVerbs.h"

#include "adminhostctl/DoctorVerb.h"
#include "adminhostctl/LogsVerb.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/Table.h"
#include "adminhostctl/Width.h"
#include "platform/json/Json.h"

#include <array>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

// The daemon itself

ExitStatus daemon(const Context& context, Words) {
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

std::string typeText(const DescribedKey& key) {
    const std::string type = key.enteredAs.empty() ? key.type : key.enteredAs;
    return type == "integer"                   ? "whole number"
           : type == "real"                    ? "number"
           : type == "boolean"                 ? "yes or no"
           : type == "scalar" || type == "any" ? "text"
                                               : type;
}

/// Key paths are long and cannot be broken: each has a line of its own, with its meaning below.
std::string keyList(const std::vector<DescribedKey>& keys, std::size_t width) {
    constexpr std::size_t indent = 6;
    std::string text;
    for (const DescribedKey& key : keys) {
        std::string help = key.help;
        for (std::size_t i = 0; i < key.allowed.size(); ++i) {
            help += (i == 0 ? " One of " : ", ") + key.allowed[i] + (i + 1 == key.allowed.size() ? "." : "");
        }
        help += key.required ? " Required." : "";
        help += key.filledWith == "languages" ? " Without it, adminhostctl sends yours." : "";
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
        for (const DescribedKey& key : description.keys()) {
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
                << shownJson(jsonOf(description.example().get("request"), true)) << '\n';
}

ExitStatus help(const Context& context, Words arguments) {
    if (!arguments.empty()) {
        helpOfCommand(context, arguments.front());
        return ExitStatus::done;
    }
    Table table({"verb", "", "meaning"});
    for (const Verb& verb : context.verbs) {
        table.addRow({std::string(verb.words), std::string(verb.arguments), std::string(verb.summary)});
    }
    context.out << table.text(context.options.width, 0)
                << "\nEvery other word is a command of the service: adminhostctl commands lists them,\n"
                   "adminhostctl help COMMAND describes one.\n";
    return ExitStatus::done;
}

// The directory

/// The entry with the names of its groups in place of their entries.
Dictionary withGroupNames(Dictionary entry) {
    const Array* groups = entry.get("groups").array();
    if (groups == nullptr) {
        return entry;
    }
    Array names;
    for (const Value& group : *groups) {
        if (group.dictionary() != nullptr) {
            names.emplace_back(group.dictionary()->text("shortName"));
        }
    }
    entry.set("groups", std::move(names));
    return entry;
}

ExitStatus whois(const Context& context, Words arguments) {
    const Value answer = context.service.get("/v1/directory?is=" + Connection::escaped(arguments.front()));
    const Array* entries = answer.dictionary() == nullptr ? nullptr : answer.dictionary()->get("entries").array();
    if (entries == nullptr || entries->empty()) {
        throw usageError("user or group not found: " + arguments.front());
    }
    if (context.options.format != Format::text) {
        writeValue(context, *entries, Description());
        return ExitStatus::done;
    }
    for (std::size_t i = 0; i < entries->size(); ++i) {
        const Dictionary* entry = (*entries)[i].dictionary();
        context.out << (i == 0 ? "" : "\n")
                    << Reading(Description(), context.options.width)
                           .text(entry == nullptr ? (*entries)[i] : Value(withGroupNames(*entry)));
    }
    return ExitStatus::done;
}

constexpr std::array table = {
    Verb{"daemon", "", "Show the daemon's running request, the waiting ones and the plug-ins", 0, 0, &daemon},
    Verb{"commands", "[--names]", "List the commands", 0, 0, &commands},
    Verb{"help", "[COMMAND]", "List the verbs, or describe a command", 0, 1, &help},
    Verb{"doctor", "", "Check the installation", 0, 0, &doctor},
    Verb{"logs", "[-f] [-n LINES] [NAME]", "List the service's logs, or print the end of one", 0, 1, &logs},
    Verb{"whois", "NAME|UUID", "Show the people and groups with this name or UUID", 1, 1, &whois},
};

constexpr std::array options = {
    VerbOption{followOption, "", "With logs: print also what is written from now on", {}, "-f"},
    VerbOption{linesOption, "LINES", "With logs: print only the last LINES lines (10 if not given)", {}, "-n"},
};

}  // namespace

std::span<const VerbOption> generalOptions() noexcept {
    return options;
}

std::span<const Verb> generalVerbs() noexcept {
    return table;
}

}  // namespace adminhost::ctl
