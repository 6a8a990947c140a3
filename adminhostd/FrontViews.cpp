// What the front shows of itself, its plug-ins and the installation.

#include "adminhostd/Front.h"
#include "adminhostd/FrontAnswers.h"
#include "platform/json/Json.h"
#include "platform/release/Release.h"

#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace adminhost {
namespace {

/// The version of the addresses and answers. Raised when a client could break; additions do not raise it.
constexpr int interfaceVersion = 1;

std::string_view nameOf(Access access) {
    switch (access) {
        case Access::read:
            return "read";
        case Access::write:
            return "write";
        case Access::control:
            return "control";
        case Access::account:
            break;
    }
    return "account";
}

/// The command as clients see it.
Dictionary describe(const Command& command) {
    Dictionary described{{"name", command.name}};
    for (const DictionaryEntry& entry : command.description) {
        described.set(entry.key, entry.value);
    }
    described.set("name", command.name);
    described.set("access", nameOf(command.access));
    described.set("showsRevision", command.showsRevision);
    described.set("takesRevision", command.takesRevision);
    described.set("needs", Array(command.needs.begin(), command.needs.end()));
    if (!command.served) {
        described.set("served", false);
    }
    if (command.deadline.count() > 0) {
        described.set("deadlineSeconds", command.deadline.count());
    }
    return described;
}

std::string_view nameOf(Diagnosis::Health health) {
    return health == Diagnosis::Health::ok ? "ok" : health == Diagnosis::Health::warning ? "warning" : "failure";
}

}  // namespace

Array describe(const std::vector<Command>& commands) {
    Array described;
    for (const Command& command : commands) {
        described.emplace_back(describe(command));
    }
    return described;
}

HttpAnswer Front::overview(const Exchange& exchange) {
    if (_queue.running() != nullptr || exchange.wantsPropertyList()) {
        return {200, overviewNow(), {}};
    }
    // Monitoring asks for it again and again, and in an idle daemon nothing of it changes.
    OverviewState now{_hellos, _queue.deadline(), _queue.waiting(), _queue.workerProblem(), _queue.workerPid()};
    if (!_overviewText || now != _overviewState) {
        _overviewText = std::make_shared<const std::string>(jsonOf(overviewNow()) + '\n');
        _overviewState = std::move(now);
    }
    HttpAnswer answer;
    answer.text = AnswerText{_overviewText};
    return answer;
}

Dictionary Front::overviewNow() const {
    Array plugins;
    if (_hello) {
        for (const protocol::OfferedPlugin& plugin : _hello->plugins) {
            Array commands;
            for (const Command& command : plugin.commands) {
                commands.emplace_back(command.name);
            }
            plugins.emplace_back(
                Dictionary{{"name", plugin.name}, {"version", plugin.version}, {"commands", std::move(commands)}});
        }
    }
    Array refused;
    for (const protocol::RefusedPlugin& plugin : refusedPlugins()) {
        refused.emplace_back(Dictionary{{"file", plugin.file}, {"reason", plugin.reason}});
    }
    Dictionary text{{"release", ADMINHOST_RELEASE},
                    {"interface", interfaceVersion},
                    {"deadlineSeconds", std::chrono::duration<double>(_queue.deadline()).count()},
                    {"plugins", std::move(plugins)}};
    text.set("refusedPlugins", refused.empty() ? Value() : Value(std::move(refused)));
    if (const Operation* running = _queue.running()) {
        Dictionary description = running->record->describe(false);
        description.remove("log");
        description.remove("state");
        text.set("running", std::move(description));
    }
    text.set("waiting", _queue.waiting());
    if (const auto problem = _queue.workerProblem()) {
        text.set("workerProblem", *problem);
    }
    if (const auto pid = _queue.workerPid()) {
        text.set("workerPid", *pid);
    }
    return text;
}

HttpAnswer Front::metrics() const {
    HttpAnswer answer;
    answer.text = AnswerText{std::make_shared<const std::string>(_metrics.text(
                                 {.waiting = _queue.waiting(),
                                  .running = _queue.running() != nullptr,
                                  .queueLimit = _queue.limit(),
                                  .deadlineSeconds = std::chrono::duration<double>(_queue.deadline()).count(),
                                  .eventClients = _events.waiting(),
                                  .workerStarts = _queue.starts(),
                                  .frontBytes = _memory.bytes()})),
                             "text/plain; version=0.0.4; charset=utf-8"};
    return answer;
}

HttpAnswer Front::doctorAnswer(const OperationQueue::Ending& ending) const {
    FrontChecks::Workers workers{_queue.workerPid(), _queue.workerProblem(), {}, refusedPlugins()};
    if (_hello) {
        for (const protocol::OfferedPlugin& plugin : _hello->plugins) {
            workers.plugins.push_back(plugin.name + ' ' + plugin.version);
        }
    }
    std::vector<Diagnosis> checks = _checks.run(workers);
    checks.push_back(_permissions.check());
    checks.push_back(_audit.check());
    const auto* answer = std::get_if<protocol::Answer>(&ending);
    if (answer != nullptr && answer->outcome == protocol::Outcome::checked) {
        checks.insert(checks.end(), answer->checks.begin(), answer->checks.end());
    } else {
        const auto* unserved = std::get_if<Unserved>(&ending);
        const bool late = unserved != nullptr && unserved->reason == Unserved::Reason::overrun;
        const std::string reason = late                  ? "They did not end in time and were stopped."
                                   : unserved != nullptr ? unserved->message
                                                         : answer->message;
        checks.push_back({Diagnosis::Health::failure, "checks of the worker",
                          "Local names, the directory and the plug-ins were not checked. " + reason,
                          "run the check again; if it fails again, see the daemon's log"});
    }
    Array described;
    for (const Diagnosis& check : checks) {
        described.emplace_back(Dictionary{
            {"name", check.name}, {"state", nameOf(check.health)}, {"found", check.found}, {"fix", check.fix}});
    }
    return {200, Dictionary{{"checks", std::move(described)}}, {}};
}

}  // namespace adminhost
