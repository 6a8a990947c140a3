#pragma once

// What has happened lately, for clients that show it: requests that ended, and what they changed. It holds names of
// commands, sections and keys, and no values.

#include "adminhostd/RequestLog.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <cstdint>
#include <deque>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

namespace adminhost {

class EventRing {
  public:
    static constexpr std::size_t length = 1000;
    static constexpr std::size_t keysMaximum = 100;  ///< names of one event; the others are left out

    /// Adds the events of a request that has ended: one for each section that it changed, and its end.
    void add(const RequestRecord& record);

    /// The number of the latest event; 0 if there was none. Numbers count from 1 in each start of the daemon.
    [[nodiscard]] std::uint64_t last() const noexcept { return _last; }
    /// Distinguishes the numbers of one start of the daemon from those of another.
    [[nodiscard]] const std::string& epoch() const noexcept { return _epoch; }

    /// Returns true if a client that knows the events up to this number of this epoch (empty: not sent) has nothing
    /// new to learn.
    [[nodiscard]] bool isCurrent(std::uint64_t after, std::string_view epoch) const noexcept;
    /// The events after this number, with `missed` if there were others that are not kept any more. Details of a
    /// request are shown to the account that sent it, or with `all`. Without a number only the latest number.
    [[nodiscard]] Dictionary since(std::optional<std::uint64_t> after, std::string_view epoch, uid_t uid,
                                   bool all) const;

  private:
    struct Event {
        std::uint64_t number = 0;
        const char* kind = "";
        Date when;
        std::string plugin;
        std::string command;
        bool checkOnly = false;
        std::string section;            ///< of a change
        std::vector<std::string> keys;  ///< of a change
        unsigned status = 0;            ///< of an end
        std::string error;              ///< of an end
        // Details.
        uid_t uid = 0;
        std::string request;
        double milliseconds = 0;

        [[nodiscard]] Dictionary describe(bool details) const;
    };

    void add(Event event);

    std::string _epoch = newEpoch();
    std::uint64_t _last = 0;
    std::deque<Event> _events;

    [[nodiscard]] static std::string newEpoch();
};

}  // namespace adminhost
