#pragma once

// The operations that wait for the worker, and their order: that of their arrival, except that urgent ones go before
// those that only read. They do not go before changes that came earlier.

#include "adminhostd/Operation.h"

#include <chrono>
#include <cstddef>
#include <deque>
#include <functional>
#include <optional>
#include <vector>

namespace adminhost {

class WaitingOperations {
  public:
    using Clock = std::chrono::steady_clock;

    [[nodiscard]] bool empty() const noexcept { return _operations.empty(); }
    [[nodiscard]] std::size_t size() const noexcept { return _operations.size(); }
    /// How many of them are this account's.
    [[nodiscard]] std::size_t countOf(uid_t uid) const noexcept;
    /// When takeLate() has something to take; nullopt if there is no bound.
    [[nodiscard]] std::optional<Clock::time_point> due() const;

    void add(Operation operation);
    /// Puts a change that did not get its lock before all others.
    void addAgain(Operation operation);

    // Each of these removes what it returns.

    /// The next operation to run; nullopt if none may. With `locked`, changes wait, and those that only read go on.
    [[nodiscard]] std::optional<Operation> takeNext(bool locked);
    /// Those that this operation, which is about to begin, can answer as well: they only read, are identical to it, of
    /// the same account, and no change is between them. Their deadlines must not come before its own, which is bounded
    /// by no client.
    [[nodiscard]] std::vector<Operation> takeSharers(const Operation& operation, Clock::time_point now,
                                                     std::chrono::milliseconds longest);
    /// Those that had to begin or to end before now, and changes that did not get the lock until their deadline.
    [[nodiscard]] std::vector<Operation> takeLate(Clock::time_point now);
    /// Those whose clients have closed their connections.
    [[nodiscard]] std::vector<Operation> takeAbandoned();
    [[nodiscard]] std::optional<Operation> take(const RequestRecord& request);
    [[nodiscard]] std::vector<Operation> takeAll();

  private:
    std::vector<Operation> takeIf(const std::function<bool(const Operation&)>& condition);

    std::deque<Operation> _operations;
};

}  // namespace adminhost
