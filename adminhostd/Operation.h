#pragma once

// One operation: a request on its way through the queue.

#include "adminhostd/Protocol.h"
#include "adminhostd/RequestLog.h"

#include <algorithm>
#include <chrono>
#include <memory>
#include <optional>
#include <vector>

namespace adminhost {

struct Operation {
    Exchange* exchange;
    std::shared_ptr<RequestRecord> record;
    protocol::ToWorker order = {};                ///< without the time that is left
    std::chrono::milliseconds deadline = {};      ///< its own, if it is shorter than the queue's; zero: none
    bool urgent = false;                          ///< goes before waiting operations that only read
    bool changes = false;                         ///< the worker runs it only while it holds the lock for changes
    std::optional<protocol::Answer> locked = {};  ///< of the last worker that did not get the lock
    /// The end of its time, counted from its first start.
    std::optional<std::chrono::steady_clock::time_point> until = {};
    /// When it is given up unless it has begun.
    std::optional<std::chrono::steady_clock::time_point> beginBy = {};
    /// When it must have ended, whatever its deadline: the client's own bound.
    std::optional<std::chrono::steady_clock::time_point> endBy = {};
    /// Identical ones that get the same reports and the same ending. They have none of their own.
    std::vector<Operation> sharers = {};

    /// When it must have ended if it began now.
    [[nodiscard]] std::chrono::steady_clock::time_point endIfBegun(std::chrono::steady_clock::time_point now,
                                                                   std::chrono::milliseconds longest) const {
        const auto end = now + (deadline.count() > 0 ? std::min(deadline, longest) : longest);
        return endBy ? std::min(end, *endBy) : end;
    }
};

}  // namespace adminhost
