#include "adminhostctl/lumio/StatusVerb.h"

#include "adminhostctl/Reading.h"
#include "adminhostctl/Width.h"
#include "platform/value/Value.h"

#include <algorithm>
#include <iterator>
#include <optional>
#include <utility>
#include <vector>

#include <fmt/format.h>

namespace adminhost::ctl {
namespace {

/// The status that the service stores at its start if its shared file system is missing.
constexpr std::int64_t sharedFileSystemIssue = 69;

/// What could be found out.
struct Found {
    std::optional<Dictionary> service;
    std::optional<Dictionary> daemon;
    std::vector<std::string> problems;
};

std::optional<Dictionary> dictionaryOf(std::optional<Value> value) {
    const Dictionary* dictionary = value ? value->dictionary() : nullptr;
    return dictionary == nullptr ? std::nullopt : std::optional(*dictionary);
}

/// The details may need more time than the request has, for example if the grid does not reply. The state is known
/// without them.
void askService(const Context& context, Found& found) {
    for (const Dictionary& request : {Dictionary{{"variant", "withDetails"}}, Dictionary()}) {
        try {
            const CommandRef command = context.service.command("getState");
            CommandAnswer answer = context.service.ask(command, request);
            for (const ReportedGap& gap : context.service.gapsOf(answer)) {
                found.problems.push_back(gapText(gap));
            }
            found.service = dictionaryOf(std::move(answer.value));
            return;
        } catch (const Unavailable& failure) {
            found.problems.emplace_back(failure.what());
            return;
        } catch (const Failure& failure) {
            found.problems.push_back((request.empty() ? "" : "the details are not known: ") +
                                     std::string(failure.what()));
        }
    }
}

Found find(const Context& context) {
    Found found;
    try {
        found.daemon = dictionaryOf(context.service.overview());
    } catch (const Failure& failure) {
        found.problems.emplace_back(failure.what());
        return found;
    }
    askService(context, found);
    return found;
}

ExitStatus statusOf(const Found& found) {
    const std::string_view state = found.service ? found.service->text("state") : "";
    return state == "RUNNING"              ? ExitStatus::done
           : state == "RUNNING_WITH_ISSUE" ? ExitStatus::runningWithIssue
           : state == "STOPPED"            ? ExitStatus::stopped
                                           : ExitStatus::unknown;
}

std::string stateText(const Found& found) {
    switch (statusOf(found)) {
        case ExitStatus::done:
            return "running";
        case ExitStatus::stopped:
            return "stopped";
        case ExitStatus::runningWithIssue:
            break;
        default:
            return "unknown";
    }
    const std::int64_t issue = found.service->get("migrationStatus").integer().value_or(0);
    return fmt::format("running with an issue (startup status {}{})", issue,
                       issue == sharedFileSystemIssue ? ": the shared file system was not available at its start" : "");
}

/// The words for a state of the shared file system or the grid controller.
std::string wordFor(std::string_view state) {
    constexpr std::pair<std::string_view, const char*> words[] = {
        {"kNotConfigured", "not configured"},
        {"kSharedFileSystemAvailable", "available"},
        {"kSharedFileSystemUnavailable", "NOT AVAILABLE"},
        {"kNimboAvailable", "available"},
        {"kNimboUnavailable", "NOT AVAILABLE"},
    };
    const auto* found =
        std::find_if(std::begin(words), std::end(words), [&](const auto& word) { return word.first == state; });
    return found == std::end(words) ? shown(state) : found->second;
}

std::string countText(const Dictionary& dictionary, std::string_view key) {
    const auto number = dictionary.get(key).unsignedInteger();
    return number ? std::to_string(*number) : "?";
}

using Lines = std::vector<std::pair<std::string, std::string>>;

void addDetails(const Dictionary& service, Lines& lines) {
    if (const auto since = service.get("startTime").date()) {
        lines.emplace_back("started", dateText(*since));
    }
    if (service.contains("serviceHasBeenConfigured")) {
        lines.emplace_back("set up", service.get("serviceHasBeenConfigured") == Value(true) ? "yes" : "no");
    }
    if (service.contains("sharedFileSystemState")) {
        const std::string path = shown(service.text("sharedFileSystemPath"));
        const auto space = service.get("sharedFileSystemFreeSpace").unsignedInteger();
        lines.emplace_back("shared file system", path + (path.empty() ? "" : ": ") +
                                                     wordFor(service.text("sharedFileSystemState")) +
                                                     (space ? ", " + sizeText(*space) + " free" : ""));
    }
    if (service.contains("nimboControllerState")) {
        const std::string host = shown(service.text("nimboControllerHostname"));
        lines.emplace_back("grid controller",
                           host + (host.empty() ? "" : ": ") + wordFor(service.text("nimboControllerState")));
    }
    if (service.contains("totalCameras")) {
        lines.emplace_back("cameras",
                           fmt::format("{}, {} online, {} capturing", countText(service, "totalCameras"),
                                       countText(service, "onlineCameras"), countText(service, "capturingCameras")));
        lines.emplace_back("jobs", fmt::format("{} running, {} in all", countText(service, "currentJobs"),
                                               countText(service, "totalJobs")));
    }
}

void addDaemon(const Dictionary& daemon, Lines& lines) {
    const Dictionary* running = daemon.get("running").dictionary();
    std::string work = "idle";
    if (running != nullptr) {
        const auto since = running->get("since").date();
        work = fmt::format("running {}/{}{}", running->text("plugin"), running->text("command"),
                           since ? " since " + dateText(*since) : "");
    }
    lines.emplace_back(
        "daemon", shown(fmt::format("release {}, {}, {} waiting{}", daemon.text("release"), work,
                                    countText(daemon, "waiting"), daemon.contains("workerPid") ? "" : ", NO WORKER")));
    const Array* refused = daemon.get("refusedPlugins").array();
    for (const Value& plugin : refused == nullptr ? Array{} : *refused) {
        lines.emplace_back("refused plug-in",
                           plugin.dictionary() == nullptr ? "" : shown(plugin.dictionary()->text("reason")));
    }
}

void print(const Context& context, const Found& found) {
    Lines lines{{"service", stateText(found)}};
    if (found.service) {
        addDetails(*found.service, lines);
    }
    if (found.daemon) {
        addDaemon(*found.daemon, lines);
    }
    std::size_t width = 0;
    for (const auto& [name, text] : lines) {
        width = std::max(width, name.size());
    }
    for (const auto& [name, text] : lines) {
        context.out << beside(name, text, {width + 2, 4, context.options.width});
    }
}

}  // namespace

ExitStatus serviceStatus(const Context& context, std::span<const std::string>) {
    const Found found = find(context);
    if (context.options.format == Format::text) {
        print(context, found);
    } else {
        writeValue(context,
                   Dictionary{{"service", found.service ? Value(*found.service) : Value()},
                              {"daemon", found.daemon ? Value(*found.daemon) : Value()},
                              {"problems", Array(found.problems.begin(), found.problems.end())}},
                   Description());
    }
    for (const std::string& problem : found.problems) {
        context.err << "adminhostctl: " << shown(problem) << '\n';
    }
    return statusOf(found);
}

}  // namespace adminhost::ctl
