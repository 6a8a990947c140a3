#include "adminhostctl/GeneralVerbs.h"

#include "adminhostctl/AuditVerb.h"
#include "adminhostctl/Bridge.h"
#include "adminhostctl/Complete.h"
#include "adminhostctl/DirectoryNames.h"
#include "adminhostctl/DoctorVerb.h"
#include "adminhostctl/Help.h"
#include "adminhostctl/LogsVerb.h"
#include "adminhostctl/Reading.h"
#include "adminhostctl/Since.h"
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

ExitStatus cancel(const Context& context, Words arguments) {
    context.service.cancel(arguments.front());
    context.out << (context.options.format == Format::text ? "The request has been cancelled.\n" : "");
    return ExitStatus::done;
}

// The directory

/// The entry as people read it: each value once, and the names of its groups in place of their entries.
Dictionary withGroupNames(Dictionary entry) {
    entry.remove("_id_");  // the UUID again
    if (entry.get("longName") == entry.get("shortName")) {
        entry.remove("longName");
    }
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
    const std::vector<Dictionary> entries = entriesNamed(context, arguments.front());
    if (entries.empty()) {
        throw unknownName(context, "person or group", arguments.front());
    }
    if (context.options.format != Format::text) {
        writeValue(context, Array(entries.begin(), entries.end()), Description());
        return ExitStatus::done;
    }
    for (std::size_t i = 0; i < entries.size(); ++i) {
        context.out << (i == 0 ? "" : "\n")
                    << Reading(Description(), context.options.width).text(withGroupNames(entries[i]));
    }
    return ExitStatus::done;
}

// Completion

std::vector<std::string> logNames(const Context& context, const TypedArguments&) {
    return textsOf(context.service.get("/v1/logs"), "logs", "name");
}

constexpr std::array table = {
    Verb{"daemon",
         "",
         "Show the daemon's running request, the waiting ones and the plug-ins",
         0,
         0,
         &daemon,
         {{"daemon", "--format json daemon"}}},
    Verb{"cancel",
         "ID",
         "Cancel a request that waits, or is running and only reads",
         1,
         1,
         &cancel,
         {{"cancel 0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1EFF", "--timeout 5 cancel 0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1EFF"}}},
    Verb{"commands", "[--names]", "List the commands", 0, 0, &commands, {{"commands", "--format json commands"}}},
    Verb{"help",
         "[VERB | COMMAND] [--names]",
         "List the verbs, or describe a verb or a command",
         0,
         2,
         &help,
         {{"help settings set", "help plan"}}},
    Verb{"doctor", "", "Check the installation", 0, 0, &doctor, {{"doctor", "--format json doctor"}}},
    Verb{"logs",
         "[-f] [-n LINES] [--names] [NAME]",
         "List the service's logs, or print the end of one",
         0,
         1,
         &logs,
         {{"logs", "--format json logs"}},
         &logNames},
    Verb{"audit",
         "[-f] [--since TIME] [--user NAME] [--key KEY]",
         "Show who has asked the daemon for what, and what it has changed",
         0,
         0,
         &audit,
         {{"audit --since 2h", "audit -f --user anna"}}},
    Verb{"bridge",
         "",
         "Connect standard input and output with the daemon, for --host on another machine",
         0,
         0,
         &bridge,
         {{"bridge", "--socket /run/adminhostd/adminhostd.sock bridge"}}},
    Verb{"whois",
         "NAME|UUID",
         "Show the people and groups with this name or UUID",
         1,
         1,
         &whois,
         {{"whois anna", "--format json whois studio"}},
         &peopleNames},
};

constexpr std::array options = {
    VerbOption{dryRunOption, "", "Show what would be changed, and change nothing", {}, {}, true},
    VerbOption{yesOption, "", "Do not ask"},
    VerbOption{forceOption, "", "Also send a value that is outside its range or not one of its words", {}, {}, true},
    VerbOption{followOption, "", "Print also what is written from now on", {}, "-f"},
    VerbOption{linesOption, "LINES", "Print only the last LINES lines (10 if not given)", {}, "-n"},
    VerbOption{
        sinceOption, "TIME",
        "Only from this time on: a date, today, yesterday, or 90min, 2h or 3d ago (with audit 24h if not given)"},
    VerbOption{userOption, "NAME", "Only by this account, by name or number"},
    VerbOption{keyOption, "KEY", "Only changes of this setting, list or section"},
};

}  // namespace

std::span<const VerbOption> generalOptions() noexcept {
    return options;
}

std::span<const Verb> generalVerbs() noexcept {
    return table;
}

}  // namespace adminhost::ctl
