// The requests that the worker serves: how they are passed on to it, and how they end.

#include "adminhostd/Front.h"
#include "adminhostd/FrontAnswers.h"
#include "adminhostd/RequestBody.h"
#include "platform/text/IsoDate.h"
#include "platform/text/Utf8.h"

#include <string>
#include <utility>

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr auto doctorBound = std::chrono::seconds(60);
constexpr auto doctorWait = std::chrono::seconds(20);  ///< for the worker, while it runs another operation
constexpr auto logBound = std::chrono::seconds(10);

/// Returns true for the checks of the installation. No plug-in serves them.
bool isDoctor(const RequestRecord& record) {
    return record.plugin.empty() && record.command == "doctor";
}

BodyForm wantedForm(const Exchange& exchange) {
    return exchange.wantsPropertyList() ? BodyForm::propertyList : BodyForm::json;
}

/// When the request must have ended, if its client has sent a bound. It counts from the arrival, so that the time in
/// the queue is part of it.
std::optional<std::chrono::steady_clock::time_point> endByOf(const Exchange& exchange, const RequestRecord& record) {
    const auto header = exchange.header("Request-Deadline");
    const auto deadline = header ? deadlineOf(*header) : std::nullopt;
    return deadline ? std::optional(record.arrival + *deadline) : std::nullopt;
}

}  // namespace

void Front::operation(Exchange& exchange, const Target& target) {
    Operation operation{&exchange, _log.add(exchange)};
    RequestRecord& record = *operation.record;
    name(record, target);
    const auto refuse = [&](HttpAnswer answer) {
        const std::string code(codeOf(answer));
        end(operation, std::move(answer), code);
    };

    // A new worker may have loaded other plug-ins since the head arrived.
    for (auto answer : {missing(target), forbidden(exchange, target)}) {
        if (answer) {
            return refuse(std::move(*answer));
        }
    }
    const Command& command = *commandOf(target);
    auto request = requestOf(exchange.body(), *bodyFormOf(exchange.header("Content-Type").value_or("")), _bodyBounds);
    exchange.dropBody();
    if (!request) {
        using Kind = BodyProblem::Kind;
        const BodyProblem& problem = request.error();
        return refuse(problem.kind == Kind::tooManyValues ? errorAnswer(413, "BODY_TOO_LARGE", problem.text)
                      : problem.kind == Kind::tooDeep     ? errorAnswer(413, "BODY_TOO_DEEP", problem.text)
                                                          : errorAnswer(400, "MALFORMED_BODY", problem.text));
    }
    record.redaction = Redaction(command, *request);
    const auto ifMatch = exchange.header("If-Match");
    auto revisions = revisionsOf(ifMatch.value_or("*"));
    if (ifMatch && (!revisions || !command.takesRevision)) {
        return refuse(errorAnswer(400, "PRECONDITION_NOT_UNDERSTOOD",
                                  "If-Match must list quoted revisions, and is for commands that depend on the "
                                  "revision only."));
    }
    operation.deadline = command.deadline;
    operation.endBy = endByOf(exchange, record);
    const bool checkOnly = exchange.argument("check") == "1";
    record.checkOnly = checkOnly;
    operation.changes = command.access != Access::read && !checkOnly;
    operation.urgent = command.access == Access::control && !checkOnly;
    operation.order = protocol::Perform{
        .request = record.id,
        .plugin = record.plugin,
        .command = record.command,
        .caller = {record.peer.uid, record.peer.pid, record.peer.login, record.peer.unit},
        .received = record.received,
        .arguments = std::move(*request),
        .revisions = std::move(*revisions),
        // A client that has written goes on with the revision that its own write left.
        .showsRevision = command.showsRevision || command.takesRevision,
        .keepsHistory = command.takesRevision,
        .checkOnly = checkOnly,
        .milliseconds = 0,
        .form = wantedForm(exchange),
    };
    enqueue(std::move(operation));
}

tl::expected<protocol::ToWorker, HttpAnswer> Front::orderFor(const Exchange& exchange, const Target& target) {
    const auto refuse = [](const char* what) {
        return tl::unexpected<HttpAnswer>(errorAnswer(400, "MALFORMED_ADDRESS", what));
    };
    for (const char* argument : {"match", "is", "plugin", "user", "key", "after"}) {
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
            const auto inode = numberOf(exchange.argument("inode"));
            const auto offset = numberOf(exchange.argument("offset"));
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
        case Target::Kind::audit: {
            const std::string_view since = exchange.argument("since");
            const auto date = since.empty() ? Date() : isoDateOf(since);
            if (!date || date->time_since_epoch().count() < 0) {
                return refuse("\"since\" must be a date like 2026-01-31T08:00:00Z, from 1970 on.");
            }
            return protocol::ReadAudit{.since = static_cast<std::uint64_t>(date->time_since_epoch().count()),
                                       .user = std::string(exchange.argument("user")),
                                       .key = std::string(exchange.argument("key")),
                                       .after = std::string(exchange.argument("after")),
                                       .milliseconds = 0,
                                       .form = wantedForm(exchange)};
        }
        default:
            return protocol::FindAccounts{std::string(exchange.argument("match")), std::string(exchange.argument("is")),
                                          wantedForm(exchange)};
    }
}

void Front::query(Exchange& exchange, const Target& target) {
    // A client that follows a log or the audit asks every second: that must not push other requests out of the log of
    // requests.
    const bool follows = (target.kind == Target::Kind::logs && !exchange.argument("inode").empty()) ||
                         (target.kind == Target::Kind::audit && !exchange.argument("after").empty());
    Operation operation{&exchange, follows ? RequestLog::begin(exchange) : _log.add(exchange)};
    operation.record->repeated = follows;
    if (target.kind == Target::Kind::logs || target.kind == Target::Kind::audit) {
        operation.record->place = fmt::format("{}?{}", exchange.path(), exchange.argument("plugin"));
    }
    name(*operation.record, target);
    auto order = orderFor(exchange, target);
    if (!order) {
        const std::string code(codeOf(order.error()));
        end(operation, std::move(order.error()), code);
        return;
    }
    operation.order = *std::move(order);
    operation.endBy = endByOf(exchange, *operation.record);
    if (target.kind == Target::Kind::doctor) {
        operation.deadline = doctorBound;
        operation.beginBy = std::chrono::steady_clock::now() + doctorWait;
    } else if (target.kind == Target::Kind::logs || target.kind == Target::Kind::audit) {
        operation.deadline = logBound;
    }
    enqueue(std::move(operation));
}

void Front::enqueue(Operation operation) {
    const Peer& peer = operation.record->peer;
    const auto hasTooMany = [&] { return !_permissions.isOwn(peer) && _queue.fullFor(peer.uid); };
    const auto full = [&] { return _queue.full(operation.urgent); };
    if (full() || hasTooMany()) {
        _queue.dropAbandoned();
    }
    if (hasTooMany()) {
        end(operation,
            retryLater("TOO_MANY_WAITING_OF_ACCOUNT",
                       fmt::format("{} requests of this account wait already; wait for their answers.",
                                   _queue.limitPerAccount())),
            "TOO_MANY_WAITING_OF_ACCOUNT");
        return;
    }
    if (full()) {
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

void Front::finished(const Operation& operation, OperationQueue::Ending ending) {
    const auto* unserved = std::get_if<Unserved>(&ending);
    const bool cancelled = unserved != nullptr && unserved->reason == Unserved::Reason::cancelled;
    if (isDoctor(*operation.record) && !cancelled) {
        return end(operation, doctorAnswer(ending), {});
    }
    HttpAnswer http;
    std::string code;
    if (unserved != nullptr) {
        http = answerFor(*unserved);
        code = codeOf(http);
    } else {
        auto& answer = std::get<protocol::Answer>(ending);
        http = answerFor(answer);
        if (http.status < 300 && !answer.revision.empty()) {
            http.headers.emplace_back("ETag", fmt::format("\"{}\"", answer.revision));
        }
        code = http.text ? answer.error : codeOf(http);
    }
    if (http.text) {
        http.text->clients = 1 + operation.sharers.size();
    }
    for (const Operation& sharer : operation.sharers) {
        end(sharer, http, code);
    }
    end(operation, std::move(http), code);
}

HttpAnswer Front::cancel(const Peer& peer, const RequestRecord& record) {
    // Copied, because the record may be dropped when its request ends.
    const std::string id = record.id;
    AuditEvent event = _audit.cancellation(peer, record);
    if (peer.uid != record.peer.uid && !_permissions.isOwn(peer)) {
        _audit.cancelled(std::move(event), 403, "NOT_PERMITTED");
        return errorAnswer(403, "NOT_PERMITTED", "Only the account that sent the request, and root, may cancel it.");
    }
    if (record.state == RequestRecord::State::done) {
        return errorAnswer(409, "REQUEST_ENDED", fmt::format("The request {} has ended already.", id));
    }
    const bool running = record.state == RequestRecord::State::running;
    if (!_queue.cancel(record)) {
        return errorAnswer(409, "CHANGE_RUNNING",
                           fmt::format("The request {} is changing something. It is not interrupted, because half of a "
                                       "change is worse than none; it ends by itself, at its deadline at the latest.",
                                       id));
    }
    _audit.cancelled(std::move(event), 200, "");
    return {200, Dictionary{{"request", id}, {"state", running ? "running" : "waiting"}, {"cancelled", true}}, {}};
}

void Front::end(const Operation& operation, HttpAnswer answer, std::string_view code) {
    RequestRecord& record = *operation.record;
    close(record, answer.status, code);
    if (!record.repeated || answer.status >= 300) {
        _events.add(record);
    }
    for (const auto& [name, count] :
         {std::pair("Adminhost-Changes", record.changes()), std::pair("Adminhost-Not-Done", record.notDone())}) {
        if (count > 0) {
            answer.headers.emplace_back(name, std::to_string(count));
        }
    }
    operation.exchange->answer(std::move(answer));
}

}  // namespace adminhost
