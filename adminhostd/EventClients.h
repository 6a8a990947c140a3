#pragma once

// The clients that wait for the next event. They need no worker, and their number is bounded.

#include "adminhostd/EventRing.h"
#include "adminhostd/Http.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <list>
#include <optional>
#include <string>

namespace adminhost {

class EventClients {
  public:
    using Clock = std::chrono::steady_clock;

    static constexpr std::size_t maximum = 64;
    static constexpr std::size_t maximumOfAccount = 16;  ///< of one that is not root
    static constexpr auto patience = std::chrono::seconds(30);

    /// Answers the request now, if there is something new or nothing can be waited for, or later. `all`: the client may
    /// see the details of every request.
    void serve(Exchange& exchange, bool all);
    /// Adds the events of a request that has ended, and sends them to the waiting clients.
    void add(const RequestRecord& record);

    [[nodiscard]] std::size_t waiting() const noexcept { return _clients.size(); }
    [[nodiscard]] std::optional<Clock::time_point> due() const;
    /// Answers the clients that have waited long enough.
    void run();
    /// Answers all clients, and from now on each at once.
    void stop();

  private:
    struct Client {
        Exchange* exchange;
        std::uint64_t after;
        std::string epoch;
        bool all;
        Clock::time_point until;
    };

    [[nodiscard]] bool full(uid_t uid) const;
    void dropAbandoned();
    void answerAll();
    void answer(const Client& client) const;

    EventRing _ring;
    std::list<Client> _clients;  ///< in the order of their time
    bool _stopping = false;
};

}  // namespace adminhost
