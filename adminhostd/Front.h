#pragma once

// The front: what each address serves, who may ask, and the audit.

#include "adminhostd/Http.h"
#include "adminhostd/OperationQueue.h"
#include "adminhostd/RequestLog.h"

#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

namespace adminhost {

class Front {
  public:
    /// The configuration for the workers, and the plug-ins that were not even offered to them. Hands the operations to
    /// a worker, which it starts.
    Front(OperationQueue::Settings settings, std::vector<protocol::RefusedPlugin> refused);
    Front(const Front&) = delete;
    Front& operator=(const Front&) = delete;

    [[nodiscard]] OperationQueue& queue() noexcept { return _queue; }

    /// For a request whose head has arrived: the answer that needs no body (not permitted, not found, not understood),
    /// or the function that serves it once its body is there, at once or, an operation, when it has run. Permission,
    /// address and id are looked at here only.
    [[nodiscard]] std::variant<HttpAnswer, HttpServer::Serve> head(Exchange& exchange);

  private:
    struct Target {
        enum class Kind { unknown, overview, plugin, command, request, directory, history };
        Kind kind = Kind::unknown;
        std::string plugin;
        std::string command;  ///< or, of a request, its id

        /// Whether it is served by the worker, and remembered.
        [[nodiscard]] bool isOperation() const noexcept {
            return kind == Kind::command || kind == Kind::directory || kind == Kind::history;
        }
    };

    void welcome(protocol::Hello hello);
    [[nodiscard]] static Target targetOf(std::string_view path);
    [[nodiscard]] const protocol::OfferedPlugin* pluginNamed(std::string_view name) const;
    [[nodiscard]] std::vector<protocol::RefusedPlugin> refusedPlugins() const;

    /// Makes the id that a client may have sent the exchange's; an answer if it cannot be.
    std::optional<HttpAnswer> adoptId(Exchange& exchange, const Target& target);
    /// The answer if the plug-in or its command does not exist.
    [[nodiscard]] std::optional<HttpAnswer> missing(const Target& target) const;
    [[nodiscard]] std::optional<HttpAnswer> refusal(const Exchange& exchange, const Target& target) const;
    void serve(Exchange& exchange, const Target& target);
    [[nodiscard]] HttpAnswer overview() const;
    void operation(Exchange& exchange, const Target& target);
    /// What the worker serves without an operation of a plug-in.
    void query(Exchange& exchange, const Target& target);
    void enqueue(Operation operation);
    void finished(const Operation& operation, OperationQueue::Ending ending);
    /// Answers an operation, and logs its end.
    static void end(const Operation& operation, HttpAnswer answer, std::string_view code);

    RequestLog _log;
    std::vector<protocol::RefusedPlugin> _refused;  ///< before a worker saw them
    std::optional<protocol::Hello> _hello;          ///< of the latest worker
    OperationQueue _queue;
};

}  // namespace adminhost
