#pragma once

// The front: what each address answers, who may ask, and the audit.

#include "adminhostd/History.h"
#include "adminhostd/Http.h"
#include "adminhostd/OperationQueue.h"

#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

class Front {
  public:
    /// The configuration for the workers; its "refused" lists the plug-ins that were not even offered to them. Hands
    /// the operations to a worker, which it starts.
    Front(OperationQueue::Settings settings, Array refused);
    Front(const Front&) = delete;
    Front& operator=(const Front&) = delete;

    [[nodiscard]] OperationQueue& queue() noexcept { return _queue; }

    /// The answer that needs no body: who may not ask, what does not exist, what is not understood.
    [[nodiscard]] std::optional<HttpAnswer> head(const Exchange& exchange);
    /// Serves a request that head() let pass: at once or, an operation, when it has run.
    void serve(Exchange& exchange);

  private:
    struct Address {
        enum class Kind { unknown, overview, plugin, command, request, directory, history };
        Kind kind = Kind::unknown;
        std::string_view plugin;
        std::string_view command;
    };

    /// Takes over what a worker says of itself; false when it is not of the form that everything else relies on.
    bool welcome(const Dictionary& hello);
    [[nodiscard]] static Address addressOf(std::string_view path);
    [[nodiscard]] const Dictionary* pluginNamed(std::string_view name) const;
    [[nodiscard]] static const Dictionary* commandNamed(const Dictionary& plugin, std::string_view name);
    [[nodiscard]] std::optional<HttpAnswer> refusal(const Exchange& exchange, const Address& address) const;
    [[nodiscard]] HttpAnswer overview() const;
    void operation(Exchange& exchange, const Address& address);
    /// What the worker answers without an operation of a plug-in.
    void query(Exchange& exchange, const Address& address);
    void finished(const Operation& operation, Dictionary answer);
    void close(RequestRecord& record, const HttpAnswer& answer);

    History _history;
    Array _refused;     ///< plug-ins that were refused before a worker saw them
    Dictionary _hello;  ///< what the latest worker said of itself
    OperationQueue _queue;
};

}  // namespace adminhost
