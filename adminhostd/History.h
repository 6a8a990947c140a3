#pragma once

// What the daemon remembers of the latest requests for operations.

#include "adminhostd/Http.h"
#include "platform/value/Value.h"

#include <chrono>
#include <deque>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

/// One request, from its arrival on. Values of requests and answers are never part of it.
struct RequestRecord {
    enum class State { waiting, running, done };

    std::string id;
    std::string plugin;
    std::string command;
    Peer peer;
    State state = State::waiting;
    Date received;
    std::chrono::steady_clock::time_point arrival;
    Date since;  ///< when it began to run
    std::chrono::steady_clock::time_point start;
    double milliseconds = 0;  ///< from arrival to answer
    unsigned status = 0;
    std::string error;  ///< the code of an answer that is an error
    std::vector<std::string> log;

    /// Keeps an event; beyond 64 KiB a request's events are only counted.
    void addLog(std::string_view event);
    /// The form that clients get.
    [[nodiscard]] Dictionary describe() const;

  private:
    std::size_t _logBytes = 0;
    std::size_t _dropped = 0;
};

class History {
  public:
    static constexpr std::size_t length = 200;

    /// A record that is not remembered.
    [[nodiscard]] static std::shared_ptr<RequestRecord> begin(const Exchange& exchange);
    /// Begins a record; the oldest one is forgotten.
    std::shared_ptr<RequestRecord> add(const Exchange& exchange);
    [[nodiscard]] const RequestRecord* find(std::string_view id) const;

  private:
    std::deque<std::shared_ptr<RequestRecord>> _records;
};

}  // namespace adminhost
