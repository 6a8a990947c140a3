#include "adminhostd/Front.h"

#include "adminhostd/FrontAnswers.h"
#include "adminhostd/RequestBody.h"
#include "platform/log/Log.h"
#include "platform/release/Release.h"
#include "platform/text/Uuid.h"

#include <algorithm>
#include <functional>
#include <memory>
#include <utility>

#include <fmt/format.h>
#include <fmt/ranges.h>

namespace adminhost {
namespace {

constexpr const char* unknownName = "(unknown)";

/// The class that a target needs; nullopt if any class will do. A command that does not exist needs none: a client with
/// any right may know which ones there are.
std::optional<Right> neededFor(const Target& target, const Command* command) {
    using Kind = Target::Kind;
    switch (target.kind) {
        case Kind::command:
            return command == nullptr ? std::nullopt : std::optional(rightFor(command->access));
        case Kind::directory:
        case Kind::history:
        case Kind::doctor:
        case Kind::logs:
        case Kind::metrics:
            return Right::read;
        case Kind::audit:
            return Right::audit;
        case Kind::events:
        case Kind::unknown:
        case Kind::overview:
        case Kind::plugin:
        case Kind::request:
            break;
    }
    return std::nullopt;
}

/// Returns true if the method is in the value of an Allow header.
bool lists(std::string_view allowed, std::string_view method) {
    while (!allowed.empty()) {
        const std::size_t end = std::min(allowed.find(", "), allowed.size());
        if (allowed.substr(0, end) == method) {
            return true;
        }
        allowed.remove_prefix(std::min(end + 2, allowed.size()));
    }
    return false;
}

/// The names of plug-ins or commands, for a message.
std::string namesIn(const auto& named) {
    std::vector<std::string_view> names;
    names.reserve(named.size());
    for (const auto& one : named) {
        names.push_back(one.name);
    }
    return names.empty() ? "none" : fmt::format("{}", fmt::join(names, ", "));
}

const auto* elementNamed(const auto& named, std::string_view name) {
    const auto found = std::find_if(named.begin(), named.end(), [&](const auto& one) { return one.name == name; });
    return found == named.end() ? nullptr : &*found;
}

}  // namespace

Front::Front(const OperationQueue::Settings& settings, MonitorLink& monitor, FrontChecks checks,
             Permissions permissions)
    : _checks(std::move(checks)),
      _permissions(std::move(permissions)),
      _queue(settings, monitor,
             {[this](protocol::Hello hello) { welcome(std::move(hello)); },
              [](const std::string& event) { logEvent(event); }, [this](const SecretPart& part) { _log.hide(part); },
              [this](const Operation& operation, const protocol::Begun& about) {
                  operation.record->begun = true;
                  _audit.begun(*operation.record, about);
              },
              [this](const protocol::Unfinished& request) { unfinished(request); },
              [this](const protocol::Answer& answer) {
                  _metrics.workDone(answer.toolRuns, answer.directoryLookups, answer.residentBytes);
              },
              [this](const Operation& operation, OperationQueue::Ending ending) {
                  finished(operation, std::move(ending));
              }}) {
    logProblems();
}

void Front::reconfigure(const Options& options, Permissions permissions) {
    _checks.reconfigure(options);
    _permissions = std::move(permissions);
    logProblems();
}

void Front::logProblems() const {
    for (const auto* problems : {&_permissions.problems(), &_permissions.kept()}) {
        for (const std::string& problem : *problems) {
            logEvent("adminhostd: " + problem);
        }
    }
}

std::vector<protocol::RefusedPlugin> Front::refusedPlugins() const {
    return _hello ? _hello->refused : std::vector<protocol::RefusedPlugin>();
}

void Front::welcome(protocol::Hello hello) {
    _hello = std::move(hello);
    ++_hellos;
    for (const protocol::RefusedPlugin& plugin : refusedPlugins()) {
        logEvent(fmt::format("adminhostd: a plug-in is refused: {}", plugin.reason));
    }
    logEvent(
        fmt::format("adminhostd: release " ADMINHOST_RELEASE " serves with the plug-ins {}", namesIn(_hello->plugins)));
}

void Front::unfinished(const protocol::Unfinished& request) {
    const RequestRecord* record = _log.find(request.request);
    if (record == nullptr || record->state != RequestRecord::State::done) {
        _audit.unfinished(request);
    }  // else its worker died, and this front has logged its end
}

void Front::name(RequestRecord& record, const Target& target) const {
    using Kind = Target::Kind;
    const Command* command = commandOf(target);
    record.plugin = target.plugin.empty() || pluginNamed(target.plugin) != nullptr ? target.plugin : unknownName;
    switch (target.kind) {
        case Kind::command:
            record.command = command != nullptr ? target.command : unknownName;
            break;
        case Kind::overview:
            record.command = "overview";
            break;
        case Kind::plugin:
            record.command = "commands";
            break;
        case Kind::request:
            record.command = "requests";
            break;
        case Kind::logs:
            record.command = "logs";
            break;
        case Kind::unknown:
            record.command = unknownName;
            break;
        case Kind::directory:
        case Kind::history:
        case Kind::doctor:
        case Kind::audit:
        case Kind::events:
        case Kind::metrics:
            record.command = target.command;
            break;
    }
    if (const auto needed = neededFor(target, command)) {
        record.access = nameOf(*needed);
    }
}

void Front::close(RequestRecord& record, unsigned status, std::string_view code) {
    record.close(status, code);
    // Only names that exist: a client must not be able to fill the memory with others.
    const bool known = record.plugin != unknownName && record.command != unknownName;
    _metrics.requestEnded(known ? record.plugin : "", known ? record.command : "", status, code,
                          record.milliseconds / 1000, record.checkOnly);
    _audit.ended(record);
}

const protocol::OfferedPlugin* Front::pluginNamed(std::string_view name) const {
    return _hello ? elementNamed(_hello->plugins, name) : nullptr;
}

const Command* Front::commandOf(const Target& target) const {
    const protocol::OfferedPlugin* plugin = pluginNamed(target.plugin);
    return plugin == nullptr ? nullptr : elementNamed(plugin->commands, target.command);
}

std::optional<HttpAnswer> Front::adoptId(Exchange& exchange, const Target& target) {
    const auto id = exchange.header("Request-Id");
    if (!id || !target.isOperation()) {
        return std::nullopt;
    }
    if (!uuidOf(*id)) {
        return errorAnswer(400, "MALFORMED_REQUEST_ID",
                           "Request-Id must be a UUID in its canonical form of 36 characters.");
    }
    if (!_log.use(*id)) {
        return errorAnswer(
            409, "REQUEST_ID_USED",
            fmt::format("The request id {} has been used already; nothing was run. /v1/requests/{} shows what became "
                        "of that request; a new request needs a new id.",
                        *id, *id));
    }
    exchange.adoptId(std::string(*id));
    return std::nullopt;
}

std::optional<HttpAnswer> Front::missing(const Target& target) const {
    const protocol::OfferedPlugin* plugin = pluginNamed(target.plugin);
    if (plugin == nullptr && !_hello) {
        return retryLater("WORKER_UNAVAILABLE",
                          _queue.workerProblem().value_or("No worker has started yet, so that no plug-in is known."));
    }
    if (plugin == nullptr) {
        return errorAnswer(
            404, "UNKNOWN_PLUGIN",
            fmt::format("Plug-in not found: {}. Known plug-ins: {}.", target.plugin, namesIn(_hello->plugins)));
    }
    if (target.kind == Target::Kind::command && commandOf(target) == nullptr) {
        return errorAnswer(404, "UNKNOWN_COMMAND",
                           fmt::format("The plug-in \"{}\" has no command \"{}\". Known commands: {}.", target.plugin,
                                       target.command, namesIn(plugin->commands)));
    }
    if (target.kind == Target::Kind::command && !commandOf(target)->served) {
        return errorAnswer(501, "NOT_SERVED",
                           fmt::format("The plug-in \"{}\" describes the command \"{}\", but does not serve it yet.",
                                       target.plugin, target.command));
    }
    return std::nullopt;
}

std::optional<HttpAnswer> Front::forbidden(const Exchange& exchange, const Target& target) {
    const Peer& peer = exchange.peer();
    const Rights rights = _permissions.of(peer);
    const std::optional<Right> needed = rights.any() ? neededFor(target, commandOf(target)) : Right::read;
    if (!needed || rights.has(*needed)) {
        return std::nullopt;
    }
    return errorAnswer(403, "NOT_PERMITTED", _permissions.refusal(peer, _audit.names().of(peer.uid), *needed));
}

const RequestRecord* Front::requestFor(const Peer& peer, std::string_view id) const {
    const RequestRecord* record = _log.find(id);
    const bool visible = record != nullptr && (record->peer.uid == peer.uid || _permissions.of(peer).has(Right::read));
    return visible ? record : nullptr;
}

std::optional<HttpAnswer> Front::refusal(const Exchange& exchange, const Target& target) const {
    using Kind = Target::Kind;
    if (target.kind == Kind::unknown) {
        return errorAnswer(
            404, "UNKNOWN_ADDRESS",
            "Known addresses: /v1/, /v1/PLUGIN, /v1/PLUGIN/COMMAND, /v1/PLUGIN/history, /v1/audit, "
            "/v1/directory, /v1/doctor, /v1/events, /v1/logs, /v1/logs/NAME, /v1/metrics, /v1/requests/ID.");
    }
    if (target.kind == Kind::plugin || target.kind == Kind::command || target.kind == Kind::history) {
        if (auto answer = missing(target)) {
            return answer;
        }
    }
    if (target.kind == Kind::request && requestFor(exchange.peer(), target.command) == nullptr) {
        return unknownRequest(target.command);
    }
    const bool post = target.kind == Kind::command;
    const char* const allowed = post ? "POST" : target.kind == Kind::request ? "GET, HEAD, DELETE" : "GET, HEAD";
    if (!lists(allowed, exchange.method())) {
        HttpAnswer answer =
            errorAnswer(405, "METHOD_NOT_ALLOWED", fmt::format("The methods of this address: {}.", allowed));
        answer.headers.emplace_back("Allow", allowed);
        return answer;
    }
    if (const auto deadline = exchange.header("Request-Deadline"); deadline && !deadlineOf(*deadline)) {
        return errorAnswer(400, "MALFORMED_DEADLINE",
                           "Request-Deadline must be a whole number of seconds, at least 1.");
    }
    if (exchange.hasArgument("check") && (!post || exchange.argument("check") != "1")) {
        return errorAnswer(400, "MALFORMED_ADDRESS",
                           "The argument \"check\" must be 1 and is for commands only: then only the check runs.");
    }
    if (post && !bodyFormOf(exchange.header("Content-Type").value_or(""))) {
        return errorAnswer(415, "UNSUPPORTED_TYPE",
                           "A request's body is application/json (also when no type is given) or application/x-plist.");
    }
    return std::nullopt;
}

std::variant<HttpAnswer, HttpServer::Serve> Front::head(Exchange& exchange) {
    const Target target = targetOf(exchange.path());
    std::optional<HttpAnswer> answer = forbidden(exchange, target);
    const bool stranger = answer.has_value();
    if (!answer && exchange.headProblem()) {
        answer = exchange.headProblem();  // and its id stays unused: nothing in such a head is trusted
    } else if (!answer) {
        answer = adoptId(exchange, target);
    }
    if (!answer) {
        answer = refusal(exchange, target);
    }
    if (!answer) {
        return [this, target](Exchange& whole) { serve(whole, target); };
    }
    if (stranger || exchange.method() == "POST") {
        // Log unauthorised requests, but keep them out of the log of requests.
        const std::shared_ptr<RequestRecord> record = stranger ? RequestLog::begin(exchange) : _log.add(exchange);
        name(*record, target);
        close(*record, answer->status, codeOf(*answer));
    }
    return std::move(*answer);
}

void Front::serve(Exchange& exchange, const Target& target) {
    switch (target.kind) {
        case Target::Kind::command:
            operation(exchange, target);
            return;
        case Target::Kind::directory:
        case Target::Kind::history:
        case Target::Kind::doctor:
        case Target::Kind::logs:
        case Target::Kind::audit:
            query(exchange, target);
            return;
        case Target::Kind::plugin: {
            const protocol::OfferedPlugin* plugin = pluginNamed(target.plugin);
            exchange.answer(plugin == nullptr ? *missing(target) : HttpAnswer{200, describe(plugin->commands), {}});
            return;
        }
        case Target::Kind::request: {
            const RequestRecord* record = requestFor(exchange.peer(), target.command);
            if (record == nullptr) {  // forgotten while the body was being received
                exchange.answer(unknownRequest(target.command));
                return;
            }
            if (exchange.method() == "DELETE") {
                exchange.answer(cancel(exchange.peer(), *record));
                return;
            }
            const bool withReports = exchange.peer().uid == record->peer.uid || _permissions.isOwn(exchange.peer());
            exchange.answer({200, record->describe(withReports), {}});
            return;
        }
        case Target::Kind::events:
            _events.serve(exchange, _permissions.isOwn(exchange.peer()));
            return;
        case Target::Kind::metrics:
            exchange.answer(metrics());
            return;
        case Target::Kind::overview:
        case Target::Kind::unknown:
            exchange.answer(overview(exchange));
            return;
    }
}

}  // namespace adminhost
