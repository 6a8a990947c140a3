#include "adminhostd/Front.h"

#include "adminhostd/RequestBody.h"
#include "platform/log/Log.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <charconv>
#include <functional>
#include <memory>
#include <system_error>
#include <utility>

#include <fmt/format.h>
#include <fmt/ranges.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr const char* retrySeconds = "1";
constexpr std::size_t keptName = 100;  ///< bytes of an unknown name that are remembered and logged
constexpr std::string_view doctor = "doctor";
constexpr auto doctorBound = std::chrono::seconds(60);
constexpr auto doctorWait = std::chrono::seconds(20);  ///< for the worker, while it runs another operation
constexpr auto logBound = std::chrono::seconds(10);

HttpAnswer errorAnswer(unsigned status, std::string_view code, std::string_view message) {
    return {status, Dictionary{{"error", code}, {"message", message}}, {}};
}

HttpAnswer retryLater(std::string_view code, std::string_view message) {
    HttpAnswer answer = errorAnswer(503, code, message);
    answer.headers.emplace_back("Retry-After", retrySeconds);
    return answer;
}

/// The code of an error that comes from the front itself.
std::string_view codeOf(const HttpAnswer& answer) {
    const Dictionary* body = answer.status >= 400 && answer.body ? answer.body->dictionary() : nullptr;
    return body == nullptr ? std::string_view() : body->text("error");
}

/// These accounts also see the reports of others' requests.
bool permitted(const Peer& peer) {
    return peer.uid == 0 || peer.uid == ::geteuid();
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
    if (command.deadline.count() > 0) {
        described.set("deadlineSeconds", command.deadline.count());
    }
    return described;
}

Array describe(const std::vector<Command>& commands) {
    Array described;
    for (const Command& command : commands) {
        described.emplace_back(describe(command));
    }
    return described;
}

HttpAnswer findingsAnswer(const std::vector<Finding>& findings) {
    const Finding& first = findings.front();
    HttpAnswer answer =
        errorAnswer(422, "REQUEST_REFUSED",
                    fmt::format("The request cannot be carried out. {}{}: {}.",
                                findings.size() == 1 ? "" : fmt::format("The first of {} findings: ", findings.size()),
                                first.keyPath, first.rule));
    Array list;
    for (const Finding& finding : findings) {
        list.emplace_back(Dictionary{{"keyPath", finding.keyPath}, {"rule", finding.rule}, {"advice", finding.advice}});
    }
    answer.body->dictionary()->set("findings", std::move(list));
    return answer;
}

HttpAnswer textAnswer(unsigned status, protocol::Answer& answer) {
    HttpAnswer http{status, std::nullopt, {}};
    http.text = AnswerText{std::move(answer.bytes), answer.form == BodyForm::json ? "application/json"  //
                                                                                  : "application/x-plist"};
    return http;
}

HttpAnswer answerFor(protocol::Answer& answer) {
    using protocol::Outcome;
    switch (answer.outcome) {
        case Outcome::nothing:
            return {204, std::nullopt, {}};
        case Outcome::answered:
            return textAnswer(200, answer);
        case Outcome::error:
            return textAnswer(500, answer);
        case Outcome::later:
            return retryLater(answer.error, answer.message);
        case Outcome::refused:
            return findingsAnswer(answer.findings);
        case Outcome::conflict:
            return errorAnswer(412, "REVISION_CHANGED",
                               "The settings have changed since they were read. Read them again.");
        case Outcome::overrun:
            return errorAnswer(504, "DEADLINE_EXCEEDED", "The command did not end in time and was stopped.");
        case Outcome::locked:
            return retryLater("WRITE_LOCKED", answer.message);
        case Outcome::absent:
            return errorAnswer(404, answer.error, answer.message);
        case Outcome::checked:  // doctorAnswer()
        case Outcome::broken:
            break;
    }
    return errorAnswer(500, "WORKER_FAILED", answer.message);
}

HttpAnswer answerFor(const Unserved& unserved) {
    using Reason = Unserved::Reason;
    switch (unserved.reason) {
        case Reason::overrun:
            return errorAnswer(504, "DEADLINE_EXCEEDED", "The command did not end in time and was stopped.");
        case Reason::unavailable:
            return retryLater("WORKER_UNAVAILABLE", unserved.message);
        case Reason::stopping:
            return retryLater("STOPPING", unserved.message);
        case Reason::abandoned:
            return retryLater("CLIENT_GONE", unserved.message);
        case Reason::notBegun:
            return retryLater("WORKER_BUSY", unserved.message);
        case Reason::failed:
        case Reason::tooLarge:
            break;
    }
    return errorAnswer(500, "WORKER_FAILED", unserved.message);
}

/// Logs the end of a request and completes its record.
void close(RequestRecord& record, unsigned status, std::string_view code) {
    const std::chrono::duration<double, std::milli> duration = std::chrono::steady_clock::now() - record.arrival;
    record.milliseconds = duration.count();
    record.state = RequestRecord::State::done;
    record.status = status;
    record.error = code;
    if (record.repeated && status < 300) {
        return;
    }
    // Names from an address come from the client: only printable ones may reach the log.
    std::string name = record.plugin + "/" + record.command;
    for (char& c : name) {
        c = c < 0x21 || c > 0x7e ? '?' : c;
    }
    std::string reports;
    for (const auto& [what, count] :
         {std::pair("changes", record.changes()), std::pair("not done", record.notDone())}) {
        if (count > 0) {
            reports += fmt::format(", {}: {}", what, count);
        }
    }
    logEvent(fmt::format("adminhostd: request {} {} by uid {} pid {}: {}{}{} in {:.1f} ms{}", record.id, name,
                         record.peer.uid, record.peer.pid, record.status, record.error.empty() ? "" : " ", record.error,
                         record.milliseconds, reports));
}

/// Returns true for the checks of the installation. No plug-in serves them.
bool isDoctor(const RequestRecord& record) {
    return record.plugin.empty() && record.command == doctor;
}

std::string_view nameOf(Diagnosis::Health health) {
    return health == Diagnosis::Health::ok ? "ok" : health == Diagnosis::Health::warning ? "warning" : "failure";
}

/// The number in an argument of an address; 0 without the argument, nullopt if it is not a number.
std::optional<std::uint64_t> numberIn(std::string_view argument) {
    std::uint64_t number = 0;
    const char* const end = argument.data() + argument.size();
    const auto [rest, failure] = std::from_chars(argument.data(), end, number);
    return argument.empty() || (failure == std::errc() && rest == end) ? std::optional(number) : std::nullopt;
}

BodyForm wantedForm(const Exchange& exchange) {
    return exchange.wantsPropertyList() ? BodyForm::propertyList : BodyForm::json;
}

HttpAnswer unknownRequest(std::string_view id) {
    HttpAnswer answer = errorAnswer(
        404, "UNKNOWN_REQUEST", fmt::format("The request \"{}\" is not among the latest {}.", id, RequestLog::length));
    answer.body->dictionary()->set("state", "unknown");
    return answer;
}

}  // namespace

Front::Front(OperationQueue::Settings settings, std::vector<protocol::RefusedPlugin> refused, FrontChecks checks)
    : _checks(std::move(checks)),
      _refused(std::move(refused)),
      _queue(std::move(settings),
             {[this](protocol::Hello hello) { welcome(std::move(hello)); },
              [](const std::string& event) { logEvent(event); }, [this](const SecretPart& part) { _log.hide(part); },
              [this](const Operation& operation, OperationQueue::Ending ending) {
                  finished(operation, std::move(ending));
              }}) {}

std::vector<protocol::RefusedPlugin> Front::refusedPlugins() const {
    std::vector<protocol::RefusedPlugin> refused = _refused;
    if (_hello) {
        refused.insert(refused.end(), _hello->refused.begin(), _hello->refused.end());
    }
    return refused;
}

void Front::welcome(protocol::Hello hello) {
    _hello = std::move(hello);
    for (const protocol::RefusedPlugin& plugin : refusedPlugins()) {
        logEvent(fmt::format("adminhostd: a plug-in is refused: {}", plugin.reason));
    }
    logEvent(
        fmt::format("adminhostd: release " ADMINHOST_RELEASE " serves with the plug-ins {}", namesIn(_hello->plugins)));
}

Front::Target Front::targetOf(std::string_view path) {
    using Kind = Target::Kind;
    constexpr std::string_view root = "/v1";
    if (path == root) {
        path = "/v1/";
    }
    if (!path.starts_with("/v1/")) {
        return {};
    }
    path.remove_prefix(root.size() + 1);
    if (path.empty()) {
        return {Kind::overview, {}, {}};
    }
    const std::size_t slash = path.find('/');
    const std::string first(path.substr(0, slash));
    const std::string second(slash == std::string_view::npos ? std::string_view() : path.substr(slash + 1));
    if (first == "requests") {
        return {second.empty() ? Kind::unknown : Kind::request, {}, second};
    }
    if (path == "directory") {
        return {Kind::directory, {}, first};
    }
    if (path == doctor) {
        return {Kind::doctor, {}, first};
    }
    if (first == "logs") {
        return {Kind::logs, {}, second};
    }
    if (second == "history") {
        return {Kind::history, first, second};
    }
    return {second.empty() ? Kind::plugin : Kind::command, first, second};
}

const protocol::OfferedPlugin* Front::pluginNamed(std::string_view name) const {
    return _hello ? elementNamed(_hello->plugins, name) : nullptr;
}

std::optional<HttpAnswer> Front::adoptId(Exchange& exchange, const Target& target) {
    const auto id = exchange.header("Request-Id");
    if (!id || !target.isOperation()) {
        return std::nullopt;
    }
    if (!isCanonicalUuid(*id)) {
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
        return retryLater("WORKER_UNAVAILABLE", "No worker has started yet, so that no plug-in is known.");
    }
    if (plugin == nullptr) {
        return errorAnswer(
            404, "UNKNOWN_PLUGIN",
            fmt::format("Plug-in not found: {}. Known plug-ins: {}.", target.plugin, namesIn(_hello->plugins)));
    }
    if (target.kind == Target::Kind::command && elementNamed(plugin->commands, target.command) == nullptr) {
        return errorAnswer(404, "UNKNOWN_COMMAND",
                           fmt::format("The plug-in \"{}\" has no command \"{}\". Known commands: {}.", target.plugin,
                                       target.command, namesIn(plugin->commands)));
    }
    return std::nullopt;
}

std::optional<HttpAnswer> Front::refusal(const Exchange& exchange, const Target& target) const {
    using Kind = Target::Kind;
    if (target.kind == Kind::unknown) {
        return errorAnswer(404, "UNKNOWN_ADDRESS",
                           "Known addresses: /v1/, /v1/PLUGIN, /v1/PLUGIN/COMMAND, /v1/PLUGIN/history, /v1/directory, "
                           "/v1/doctor, /v1/logs, /v1/logs/NAME, /v1/requests/ID.");
    }
    if (target.kind == Kind::plugin || target.kind == Kind::command || target.kind == Kind::history) {
        if (auto answer = missing(target)) {
            return answer;
        }
    }
    if (target.kind == Kind::request && _log.find(target.command) == nullptr) {
        return unknownRequest(target.command);
    }
    const bool post = target.kind == Kind::command;
    const bool allowed = post ? exchange.method() == "POST" : exchange.method() == "GET" || exchange.method() == "HEAD";
    if (!allowed) {
        HttpAnswer answer = errorAnswer(405, "METHOD_NOT_ALLOWED",
                                        fmt::format("This address is for {} only.", post ? "POST" : "GET and HEAD"));
        answer.headers.emplace_back("Allow", post ? "POST" : "GET, HEAD");
        return answer;
    }
    if (post && !bodyFormOf(exchange.header("Content-Type").value_or(""))) {
        return errorAnswer(415, "UNSUPPORTED_TYPE",
                           "A request's body is application/json (also when no type is given) or application/x-plist.");
    }
    return std::nullopt;
}

std::variant<HttpAnswer, HttpServer::Serve> Front::head(Exchange& exchange) {
    const Target target = targetOf(exchange.path());
    const bool stranger = !permitted(exchange.peer());
    std::optional<HttpAnswer> answer;
    if (stranger) {
        answer = errorAnswer(403, "NOT_PERMITTED",
                             fmt::format("The account with uid {} may not use this daemon.", exchange.peer().uid));
    } else if (exchange.headProblem()) {
        answer = exchange.headProblem();  // and its id stays unused: nothing in such a head is trusted
    } else {
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
        record->plugin = target.plugin.substr(0, keptName);
        record->command = target.command.substr(0, keptName);
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
            query(exchange, target);
            return;
        case Target::Kind::plugin: {
            const protocol::OfferedPlugin* plugin = pluginNamed(target.plugin);
            exchange.answer(plugin == nullptr ? *missing(target) : HttpAnswer{200, describe(plugin->commands), {}});
            return;
        }
        case Target::Kind::request: {
            const RequestRecord* record = _log.find(target.command);
            if (record == nullptr) {  // forgotten while the body was being received
                exchange.answer(unknownRequest(target.command));
                return;
            }
            const bool withReports = exchange.peer().uid == record->peer.uid || permitted(exchange.peer());
            exchange.answer({200, record->describe(withReports), {}});
            return;
        }
        case Target::Kind::overview:
        case Target::Kind::unknown:
            exchange.answer(overview());
            return;
    }
}

HttpAnswer Front::overview() const {
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
    Dictionary text{{"release", ADMINHOST_RELEASE}, {"plugins", std::move(plugins)}};
    text.set("refusedPlugins", refused.empty() ? Value() : Value(std::move(refused)));
    if (const Operation* running = _queue.running()) {
        Dictionary description = running->record->describe(false);
        description.remove("log");
        description.remove("state");
        text.set("running", std::move(description));
    }
    text.set("waiting", _queue.waiting());
    if (const auto pid = _queue.workerPid()) {
        text.set("workerPid", *pid);
    }
    return {200, std::move(text), {}};
}

void Front::end(const Operation& operation, HttpAnswer answer, std::string_view code) {
    RequestRecord& record = *operation.record;
    close(record, answer.status, code);
    for (const auto& [name, count] :
         {std::pair("Adminhost-Changes", record.changes()), std::pair("Adminhost-Not-Done", record.notDone())}) {
        if (count > 0) {
            answer.headers.emplace_back(name, std::to_string(count));
        }
    }
    operation.exchange->answer(std::move(answer));
}

void Front::enqueue(Operation operation) {
    if (_queue.full()) {
        if (isDoctor(*operation.record)) {
            finished(operation, Unserved{Unserved::Reason::notBegun, "Too many requests are waiting already."});
            return;
        }
        end(operation, retryLater("TOO_MANY_WAITING", fmt::format("{} requests wait already.", _queue.waiting())),
            "TOO_MANY_WAITING");
        return;
    }
    _queue.add(std::move(operation));
}

void Front::operation(Exchange& exchange, const Target& target) {
    Operation operation{&exchange, _log.add(exchange)};
    RequestRecord& record = *operation.record;
    record.plugin = target.plugin;
    record.command = target.command;
    const auto refuse = [&](HttpAnswer answer) {
        const std::string code(codeOf(answer));
        end(operation, std::move(answer), code);
    };

    // A new worker may have loaded other plug-ins since the head arrived.
    if (auto answer = missing(target)) {
        return refuse(std::move(*answer));
    }
    const Command& command = *elementNamed(pluginNamed(target.plugin)->commands, target.command);
    BodyProblem problem;
    auto request = requestOf(exchange.body(), *bodyFormOf(exchange.header("Content-Type").value_or("")), problem);
    exchange.dropBody();
    if (!request) {
        return refuse(problem.tooManyValues ? errorAnswer(413, "BODY_TOO_LARGE", problem.text)
                                            : errorAnswer(400, "MALFORMED_BODY", problem.text));
    }
    const auto ifMatch = exchange.header("If-Match");
    auto revisions = revisionsOf(ifMatch.value_or("*"));
    if (ifMatch && (!revisions || !command.takesRevision)) {
        return refuse(errorAnswer(400, "PRECONDITION_NOT_UNDERSTOOD",
                                  "If-Match must list quoted revisions, and is for commands that depend on the "
                                  "revision only."));
    }
    operation.deadline = command.deadline;
    operation.changes = command.access != Access::read;
    operation.order = protocol::Perform{
        .request = record.id,
        .plugin = record.plugin,
        .command = record.command,
        .caller = {record.peer.uid, record.peer.pid, record.peer.login},
        .received = record.received,
        .arguments = std::move(*request),
        .revisions = std::move(*revisions),
        .showsRevision = command.showsRevision,
        .keepsHistory = command.takesRevision,
        .milliseconds = 0,
        .form = wantedForm(exchange),
    };
    enqueue(std::move(operation));
}

std::optional<protocol::ToWorker> Front::orderFor(const Exchange& exchange, const Target& target,
                                                  HttpAnswer& malformed) {
    const auto refuse = [&](const char* what) {
        malformed = errorAnswer(400, "MALFORMED_ADDRESS", what);
        return std::nullopt;
    };
    for (const char* argument : {"match", "is", "plugin"}) {
        if (!isUtf8(exchange.argument(argument))) {
            return refuse("The address has an argument that is not UTF-8.");
        }
    }
    switch (target.kind) {
        case Target::Kind::history:
            return protocol::ReadHistory{target.plugin, wantedForm(exchange)};
        case Target::Kind::doctor:
            return protocol::Diagnose{};
        case Target::Kind::logs: {
            const auto inode = numberIn(exchange.argument("inode"));
            const auto offset = numberIn(exchange.argument("offset"));
            if (!inode || !offset || !isUtf8(target.command)) {
                return refuse("The log's name must be UTF-8, and \"inode\" and \"offset\" decimal numbers.");
            }
            return protocol::ReadLog{.plugin = std::string(exchange.argument("plugin")),
                                     .name = target.command,
                                     .inode = *inode,
                                     .offset = *offset,
                                     .milliseconds = 0,
                                     .form = wantedForm(exchange)};
        }
        default:
            return protocol::FindAccounts{std::string(exchange.argument("match")), std::string(exchange.argument("is")),
                                          wantedForm(exchange)};
    }
}

void Front::query(Exchange& exchange, const Target& target) {
    // A client that follows a log asks every second: that must not push other requests out of the log of requests.
    const bool follows = target.kind == Target::Kind::logs && !exchange.argument("inode").empty();
    Operation operation{&exchange, follows ? RequestLog::begin(exchange) : _log.add(exchange)};
    operation.record->repeated = follows;
    operation.record->plugin = target.plugin;
    operation.record->command = target.kind == Target::Kind::logs ? "logs" : target.command;
    HttpAnswer malformed;
    auto order = orderFor(exchange, target, malformed);
    if (!order) {
        const std::string code(codeOf(malformed));
        end(operation, std::move(malformed), code);
        return;
    }
    operation.order = *std::move(order);
    if (target.kind == Target::Kind::doctor) {
        operation.deadline = doctorBound;
        operation.beginBy = std::chrono::steady_clock::now() + doctorWait;
    } else if (target.kind == Target::Kind::logs) {
        operation.deadline = logBound;
    }
    enqueue(std::move(operation));
}

HttpAnswer Front::doctorAnswer(const OperationQueue::Ending& ending) const {
    FrontChecks::Workers workers{_queue.workerPid(), _queue.workerProblem(), {}, refusedPlugins()};
    if (_hello) {
        for (const protocol::OfferedPlugin& plugin : _hello->plugins) {
            workers.plugins.push_back(plugin.name + ' ' + plugin.version);
        }
    }
    std::vector<Diagnosis> checks = _checks.run(workers);
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

void Front::finished(const Operation& operation, OperationQueue::Ending ending) {
    if (isDoctor(*operation.record)) {
        return end(operation, doctorAnswer(ending), {});
    }
    if (const auto* unserved = std::get_if<Unserved>(&ending)) {
        HttpAnswer http = answerFor(*unserved);
        const std::string code(codeOf(http));
        return end(operation, std::move(http), code);
    }
    auto& answer = std::get<protocol::Answer>(ending);
    HttpAnswer http = answerFor(answer);
    if (http.status < 300 && !answer.revision.empty()) {
        http.headers.emplace_back("ETag", fmt::format("\"{}\"", answer.revision));
    }
    const std::string code(http.text ? answer.error : codeOf(http));
    end(operation, std::move(http), code);
}

}  // namespace adminhost
