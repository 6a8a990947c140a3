#include "adminhostctl/Verb.h"

#include "adminhostctl/Reading.h"
#include "adminhostctl/Similar.h"
#include "adminhostctl/Width.h"
#include "platform/json/Json.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <array>

namespace adminhost::ctl {
namespace {

using Words = std::span<const std::string>;

std::string changeText(const ReportedChange& change) {
    const auto valueText = [&](const Value& value) {
        return change.secret ? "(secret)" : value.isNull() ? "(not set)" : textOf(value);
    };
    const std::string& name = change.name.empty() ? change.identity : change.name;
    return change.section + (name.empty() ? "" : '.' + name) + (change.key.empty() ? "" : '.' + change.key) + ": " +
           valueText(change.from) + " -> " + valueText(change.to) + (change.unverified ? " (if it existed)" : "");
}

std::vector<std::string> splitWords(std::string_view words) {
    const std::size_t blank = words.find(' ');
    if (blank == std::string_view::npos) {
        return {std::string(words)};
    }
    return {std::string(words.substr(0, blank)), std::string(words.substr(blank + 1))};
}

ExitStatus perform(const Context& context, Words words) {
    const CommandRef command = context.service.command(words.front(), firstWords(context.verbs));
    Dictionary base;
    if (!context.options.file.empty()) {
        base = parseRequest(context.sources.read(context.options.file), context.options.file);
    }
    const Dictionary request =
        buildRequest(command.description, std::move(base), {words.begin() + 1, words.end()}, context.sources);
    if (context.options.has(dryRunOption)) {
        return checkOnly(context, command, request);
    }
    ExitStatus status = ExitStatus::done;
    const auto answer = askOnce(context, command, request, status);
    if (!answer) {
        return status;
    }
    if (!answer->value) {
        context.out << (context.options.format == Format::text && !answer->notDone ? "done\n" : "");
    } else {
        writeValue(context, *answer->value, command.description);
        const Dictionary* dictionary = answer->value->dictionary();
        status =
            reportAnswered(context, dictionary != nullptr ? errorOf(command.description, *dictionary) : "", *answer);
    }
    if (answer->notDone) {
        const RequestReport report = context.service.report(answer->requestId);
        printNotDone(context, report);
        if (status == ExitStatus::done) {  // else they have been printed with the error
            printLog(context, report);
        }
        status = ExitStatus::failed;
    }
    return status;
}

/// Throws Failure(usage) if an option was given that the verb does not have. Null stands for a command.
void requireOwnOptions(const Context& context, const Verb* verb, const std::string& command) {
    for (const VerbOption& option : context.verbOptions) {
        if (!context.options.has(option.name) || (verb != nullptr ? belongsTo(option, *verb) : option.ofCommands)) {
            continue;
        }
        std::string verbs;
        for (const Verb& other : context.verbs) {
            verbs += belongsTo(option, other) ? (verbs.empty() ? "" : ", ") + std::string(other.words) : "";
        }
        throw usageError("\"" + (verb != nullptr ? std::string(verb->words) : command) +
                         "\" does not have the option " + std::string(option.name) + "; it belongs to " +
                         (option.ofCommands ? "commands" : "") + (option.ofCommands && !verbs.empty() ? ", " : "") +
                         verbs);
    }
}

}  // namespace

void writeValue(const Context& context, const Value& value, const Description& description, const std::string& path) {
    switch (context.options.format) {
        case Format::text:
            context.out << Reading(description, context.options.width).text(value, path);
            break;
        case Format::json:
            context.out << shownJson(jsonOf(value, true)) << '\n';
            break;
        case Format::plist: {
            const auto text = xmlPropertyList(value);
            if (!text) {
                throw Failure(ExitStatus::failed,
                              "the answer cannot be written as a property list: " + textOf(text.error()));
            }
            context.out << shownXml(*text);
            break;
        }
    }
}

std::string toolWordsOf(std::span<const ReportedGap> notDone) {
    constexpr std::array<std::string_view, 2> prefixes = {"Error: ", "in prepare, "};
    for (const ReportedGap& gap : notDone) {
        if (gap.keyPath.empty() && !gap.toolMessage.empty()) {
            std::string_view words = gap.toolMessage;
            for (const std::string_view prefix : prefixes) {
                words.remove_prefix(words.starts_with(prefix) ? prefix.size() : 0);
            }
            return std::string(words);
        }
    }
    return {};
}

ExitStatus reportAnswered(const Context& context, const std::string& error, const CommandAnswer& answer) {
    if (error.empty()) {
        return ExitStatus::done;
    }
    const RequestReport report = context.service.report(answer.requestId);
    const std::string words = toolWordsOf(report.notDone);
    context.err << "adminhostctl: the service returned an error: " << error
                << (words.empty() ? "" : ": " + shownIndented(words, 4)) << '\n';
    printLog(context, report);
    return ExitStatus::failed;
}

void printLog(const Context& context, const RequestReport& report) {
    context.err << (report.log.empty() ? "" : "log lines of the request:\n");
    for (const std::string& line : report.log) {
        context.err << "  " << shownIndented(line, 4) << '\n';
    }
}

std::string gapText(const ReportedGap& gap) {
    return gap.keyPath + (gap.keyPath.empty() ? "" : ": ") + gap.reason +
           (gap.toolMessage.empty() ? "" : " (" + gap.toolMessage + ")");
}

void printNotDone(const Context& context, const RequestReport& report) {
    if (report.notDone.empty()) {
        return;
    }
    context.err << "adminhostctl: these parts of the request were not carried out:\n";
    for (const ReportedGap& gap : report.notDone) {
        context.err << "  " << shownIndented(gapText(gap), 4) << '\n';
    }
    if (report.notDoneDropped > 0) {
        context.err << "  and " << report.notDoneDropped << " more\n";
    }
}

std::optional<CommandAnswer> askOnce(const Context& context, const CommandRef& command, const Dictionary& request,
                                     ExitStatus& status) {
    try {
        return context.service.ask(command, request);
    } catch (const LostAnswer& lost) {
        const RequestReport report = reportLost(context, lost);
        status = report.state == RequestReport::State::done ? ExitStatus::failed : ExitStatus::undetermined;
        return std::nullopt;
    }
}

ExitStatus checkOnly(const Context& context, const CommandRef& command, const Dictionary& request) {
    context.service.check(command, request);
    if (context.options.format == Format::text) {
        context.out << "dry run: " << shown(command.description.name())
                    << " would be carried out; nothing was changed\n";
    }
    return ExitStatus::done;
}

RequestReport reportLost(const Context& context, const LostAnswer& lost) {
    context.err << "adminhostctl: " << shown(lost.what()) << '\n';
    RequestReport report = context.service.settledReport(lost.requestId());
    const char* const state = report.state == RequestReport::State::done      ? "has ended"
                              : report.state == RequestReport::State::running ? "is still running"
                              : report.state == RequestReport::State::waiting ? "is still waiting"
                              : report.state == RequestReport::State::unknown
                                  ? "is not known to the daemon"
                                  : "cannot be looked up: the daemon cannot be reached";
    context.err << "adminhostctl: the request " << shown(lost.requestId()) << ' ' << state << "; it was not repeated\n";
    if (!report.changes.empty()) {
        context.err << "the daemon reports these changes:\n";
        for (const ReportedChange& change : report.changes) {
            context.err << "  " << shownIndented(changeText(change), 4) << '\n';
        }
        if (report.changesDropped > 0) {
            context.err << "  and " << report.changesDropped << " more\n";
        }
    }
    printNotDone(context, report);
    printLog(context, report);
    return report;
}

bool isConfirmed(const Context& context, const std::string& question) {
    if (!context.sources.terminal || context.options.has(yesOption) || context.options.has(dryRunOption) ||
        context.sources.confirm(question)) {
        return true;
    }
    context.err << "Nothing was done.\n";
    return false;
}

std::optional<std::string> wordAt(Words arguments, std::size_t index) {
    return index < arguments.size() ? std::optional(arguments[index]) : std::nullopt;
}

std::vector<std::string> firstWords(std::span<const Verb> verbs) {
    std::vector<std::string> words;
    for (const Verb& verb : verbs) {
        words.push_back(splitWords(verb.words).front());
    }
    return words;
}

bool beginsWith(const Verb& verb, Words words) {
    const std::vector<std::string> own = splitWords(verb.words);
    return words.size() <= own.size() && std::equal(words.begin(), words.end(), own.begin());
}

bool belongsTo(const VerbOption& option, const Verb& verb) {
    const auto isNamed = [&](std::string_view name) {
        for (std::size_t at = verb.arguments.find(name); !name.empty() && at != std::string_view::npos;
             at = verb.arguments.find(name, at + 1)) {
            const std::size_t end = at + name.size();
            if (end == verb.arguments.size() ||
                std::string_view(" ]|").find(verb.arguments[end]) != std::string_view::npos) {
                return true;
            }
        }
        return false;
    };
    return isNamed(option.name) || isNamed(option.brief);
}

const Verb* verbOf(std::span<const Verb> verbs, const std::vector<std::string>& words) {
    std::vector<std::string> known;
    std::string list;
    for (const Verb& verb : verbs) {
        const std::vector<std::string> own = splitWords(verb.words);
        if (own.size() <= words.size() && std::equal(own.begin(), own.end(), words.begin())) {
            return &verb;
        }
        if (own.front() == words.front()) {
            known.emplace_back(verb.words);
            list += (list.empty() ? "" : ", ") + known.back();
        }
    }
    if (known.empty()) {
        return nullptr;
    }
    if (words.size() == 1) {
        throw usageError("\"" + words.front() + "\" needs another word: " + list);
    }
    const std::string typed = words[0] + ' ' + words[1];
    throw usageError("not a verb: \"" + typed + '"' + didYouMean(typed, known) + "; the verbs are " + list);
}

Failure wrongUse(const Context& context, std::string_view words, const std::string& problem) {
    std::string usage;
    for (const Verb& verb : context.verbs) {
        if (verb.words == words) {
            usage = usageOf(verb);
        }
    }
    return usageError(std::string(words) + ": " + problem + "; usage: " + usage);
}

std::string usageOf(const Verb& verb) {
    return "adminhostctl " + std::string(verb.words) + (verb.arguments.empty() ? "" : " ") +
           std::string(verb.arguments);
}

ExitStatus run(const Context& context, const std::vector<std::string>& words) {
    const Verb* verb = verbOf(context.verbs, words);
    requireOwnOptions(context, verb, words.front());
    if (verb == nullptr) {
        return perform(context, words);
    }
    const Words arguments = Words(words).subspan(splitWords(verb->words).size());
    if (arguments.size() < verb->least) {
        throw wrongUse(context, verb->words, "an argument is missing");
    }
    if (arguments.size() > verb->most) {
        throw wrongUse(context, verb->words, "too many arguments: " + arguments[verb->most]);
    }
    return verb->run(context, arguments);
}

}  // namespace adminhost::ctl
