#pragma once

// The front: what each address serves, which clients are permitted, and the audit.

#include "adminhostd/Audit.h"
#include "adminhostd/EventClients.h"
#include "adminhostd/FrontChecks.h"
#include "adminhostd/Http.h"
#include "adminhostd/Metrics.h"
#include "adminhostd/OperationQueue.h"
#include "adminhostd/OwnMemory.h"
#include "adminhostd/Permissions.h"
#include "adminhostd/RequestLog.h"
#include "adminhostd/Target.h"

#include <chrono>
#include <cstddef>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include <sys/types.h>
#include <tl/expected.hpp>

namespace adminhost {

/// The commands as clients see them.
[[nodiscard]] Array describe(const std::vector<Command>& commands);

class Front {
  public:
    /// Creates the queue, which asks the monitor for a worker for the operations.
    Front(const OperationQueue::Settings& settings, MonitorLink& monitor, FrontChecks checks, Permissions permissions);
    Front(const Front&) = delete;
    Front& operator=(const Front&) = delete;

    [[nodiscard]] OperationQueue& queue() noexcept { return _queue; }
    /// The clients that wait for events.
    [[nodiscard]] EventClients& events() noexcept { return _events; }

    /// Changes what a body may hold.
    void setBodyBounds(const BodyBounds& bounds) noexcept { _bodyBounds = bounds; }
    /// Applies a configuration that has been read again, from the next request on.
    void reconfigure(const Options& options, Permissions permissions);
    [[nodiscard]] const Permissions& permissions() const noexcept { return _permissions; }

    /// Handles a request whose head has arrived. Returns the answer if it needs no body (not permitted, not found,
    /// malformed), else the function that serves it once its body is there: at once, or, for an operation, after it has
    /// run. The id is checked here only; permission and address are checked again before an operation.
    [[nodiscard]] std::variant<HttpAnswer, HttpServer::Serve> head(Exchange& exchange);

  private:
    void welcome(protocol::Hello hello);
    void logProblems() const;
    [[nodiscard]] const protocol::OfferedPlugin* pluginNamed(std::string_view name) const;
    /// The command that the target names; null if the worker offers none of that name.
    [[nodiscard]] const Command* commandOf(const Target& target) const;
    [[nodiscard]] std::vector<protocol::RefusedPlugin> refusedPlugins() const;

    /// Uses the id that the client may have sent as the exchange's. Returns an answer if that id is rejected.
    std::optional<HttpAnswer> adoptId(Exchange& exchange, const Target& target);
    /// Returns the answer if the plug-in or its command does not exist, or if the command is not served.
    [[nodiscard]] std::optional<HttpAnswer> missing(const Target& target) const;
    /// Returns the answer if the client lacks the right to what the target names. It is the same for every target to a
    /// client without any right, which must not find out what exists.
    [[nodiscard]] std::optional<HttpAnswer> forbidden(const Exchange& exchange, const Target& target);
    /// The request of this id, if the client may know of it: its own, or with the right to read, any; null if not.
    [[nodiscard]] const RequestRecord* requestFor(const Peer& peer, std::string_view id) const;
    [[nodiscard]] std::optional<HttpAnswer> refusal(const Exchange& exchange, const Target& target) const;
    void serve(Exchange& exchange, const Target& target);
    HttpAnswer cancel(const Peer& peer, const RequestRecord& record);
    [[nodiscard]] HttpAnswer overview(const Exchange& exchange);
    [[nodiscard]] Dictionary overviewNow() const;
    [[nodiscard]] HttpAnswer metrics() const;
    void operation(Exchange& exchange, const Target& target);
    /// Passes on a request that the worker serves without an operation of a plug-in.
    void query(Exchange& exchange, const Target& target);
    /// The order for such a request; the answer if its arguments are malformed.
    [[nodiscard]] static tl::expected<protocol::ToWorker, HttpAnswer> orderFor(const Exchange& exchange,
                                                                               const Target& target);
    void enqueue(Operation operation);
    void finished(const Operation& operation, OperationQueue::Ending ending);
    /// The front's own checks, and those of the worker or the reason why it made none.
    [[nodiscard]] HttpAnswer doctorAnswer(const OperationQueue::Ending& ending) const;
    /// A request of an earlier daemon, or of a worker that died, had begun.
    void unfinished(const protocol::Unfinished& request);
    /// Enters into a request's record what it asks for. Names from the address that do not exist are not entered: they
    /// may be anything, also a password.
    void name(RequestRecord& record, const Target& target) const;
    /// Completes a request's record and logs its end.
    void close(RequestRecord& record, unsigned status, std::string_view code);
    /// Sends an operation's answer and logs its end.
    void end(const Operation& operation, HttpAnswer answer, std::string_view code);

    /// What the overview depends on while no operation runs.
    struct OverviewState {
        unsigned long hellos = 0;
        std::chrono::milliseconds deadline{};
        std::size_t waiting = 0;
        std::optional<std::string> workerProblem = {};
        std::optional<pid_t> workerPid = {};

        bool operator==(const OverviewState&) const = default;
    };

    FrontChecks _checks;
    BodyBounds _bodyBounds;
    Permissions _permissions;
    Audit _audit;
    RequestLog _log;
    EventClients _events;
    Metrics _metrics;
    OwnMemory _memory;
    std::optional<protocol::Hello> _hello;  ///< of the latest worker
    unsigned long _hellos = 0;
    OverviewState _overviewState;
    std::shared_ptr<const std::string> _overviewText;  ///< of that state; null at first
    OperationQueue _queue;
};

}  // namespace adminhost
