#include "adminhostctl/Verb.h"

#include "adminhostctl/Reading.h"
#include "adminhostctl/Width.h"
#include "platform/json/Json.h"
#include "platform/plist/PropertyList.h"
#include "platform/value/ValueText.h"

#include <algorithm>

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

ExitStatus perform(const Context& context, Words words) {
    const CommandRef command = context.service.command(words.front());
    Dictionary base;
    if (!context.options.file.empty()) {
        base = parseRequest(context.sources.read(context.options.file), context.options.file);
    }
    const Dictionary request =
        buildRequest(command.description, std::move(base), {words.begin() + 1, words.end()}, context.sources);
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
        status = reportAnswered(context, dictionary != nullptr ? errorOf(command.description, *dictionary) : "");
    }
    if (answer->notDone) {
        status = ExitStatus::failed;
        printNotDone(context, context.service.report(answer->requestId));
    }
    return status;
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

ExitStatus reportAnswered(const Context& context, const std::string& error) {
    if (error.empty()) {
        return ExitStatus::done;
    }
    context.err << "adminhostctl: the service returned an error: " << error << '\n';
    return ExitStatus::failed;
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

RequestReport reportLost(const Context& context, const LostAnswer& lost) {
    context.err << "adminhostctl: " << shown(lost.what()) << '\n';
    const RequestReport report = context.service.settledReport(lost.requestId());
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
    if (!report.log.empty()) {
        context.err << "log lines of the request:\n";
        for (const std::string& line : report.log) {
            context.err << "  " << shownIndented(line, 4) << '\n';
        }
    }
    return report;
}

std::optional<std::string> wordAt(Words arguments, std::size_t index) {
    return index < arguments.size() ? std::optional(arguments[index]) : std::nullopt;
}

ExitStatus run(const Context& context, const std::vector<std::string>& words) {
    std::string known;
    for (const Verb& verb : context.verbs) {
        const std::vector<std::string> own = splitWords(verb.words);
        if (own.front() == words.front()) {
            known += (known.empty() ? "" : ", ") + std::string(verb.words);
        }
        if (own.size() > words.size() || !std::equal(own.begin(), own.end(), words.begin())) {
            continue;
        }
        const Words arguments = Words(words).subspan(own.size());
        if (arguments.size() < verb.least || arguments.size() > verb.most) {
            throw usageError("usage: adminhostctl " + std::string(verb.words) +
                             (verb.arguments.empty() ? "" : " " + std::string(verb.arguments)));
        }
        return verb.run(context, arguments);
    }
    if (!known.empty()) {
        throw usageError("\"" + words.front() + "\" needs another word: " + known);
    }
    return perform(context, words);
}

}  // namespace adminhost::ctl
