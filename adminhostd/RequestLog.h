#pragma once

// The log of requests: the latest requests for operations, with their events and reports.

#include "adminhostd/Http.h"
#include "adminhostd/Redaction.h"
#include "platform/framework/Report.h"
#include "platform/value/Value.h"

#include <chrono>
#include <cstddef>
#include <deque>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <unordered_set>
#include <vector>

namespace adminhost {

/// One request, from its arrival on. Of the values in requests and answers it holds only those that are reported as
/// changed, never a secret.
struct RequestRecord {
    enum class State { waiting, running, done };

    static constexpr std::size_t logMaximum = std::size_t{64} << 10U;  ///< bytes of a request's events
    static constexpr std::size_t reportsMaximum = 1000;                ///< of each kind
    static constexpr std::size_t reportBytesMaximum = std::size_t{4} << 20U;

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
    std::string error;      ///< the code of an answer that is an error
    bool repeated = false;  ///< one of many like it, which a client sends by itself: only the first is logged
    std::string place;      ///< what it reads, if that can be followed: a log or the audit
    std::string access;     ///< the class that it needs; empty if what it names does not exist
    bool checkOnly = false;
    bool begun = false;  ///< the beginning of its operation has been logged
    std::string user;    ///< the names of its accounts, if the worker has looked them up
    std::string loginUser;
    Redaction redaction;  ///< until it has ended

    // Above these bounds, events and reports are only counted.
    void add(std::string_view event);
    void add(const Change& change);
    void add(const NotDone& part);
    /// Withholds the values of kept changes of this part.
    void hide(const SecretPart& part);

    /// Completes the record with the status of the answer and the code of its error.
    void close(unsigned answered, std::string_view code);

    /// The names of the keys that the kept changes name, by section, at most so many of each.
    [[nodiscard]] std::map<std::string, std::vector<std::string>> changedKeys(std::size_t maximum) const;

    /// The number of reports, including those that were not kept.
    [[nodiscard]] std::size_t changes() const noexcept { return _changes.reported; }
    [[nodiscard]] std::size_t notDone() const noexcept { return _notDone.reported; }
    // As clients get them.
    [[nodiscard]] const Array& keptChanges() const noexcept { return _changes.kept; }
    [[nodiscard]] const Array& keptNotDone() const noexcept { return _notDone.kept; }
    [[nodiscard]] std::size_t reportBytes() const noexcept { return _reportBytes; }

    /// The form that clients get. The reports are for the account that sent the request, and for accounts that may read
    /// the reports of every request.
    [[nodiscard]] Dictionary describe(bool withReports) const;

  private:
    struct Reports {
        Array kept;
        std::size_t reported = 0;
    };
    void keep(Reports& reports, Dictionary report);

    Array _log;
    std::size_t _logBytes = 0;
    std::size_t _logDropped = 0;
    Reports _changes;
    Reports _notDone;
    std::size_t _reportBytes = 0;
};

class RequestLog {
  public:
    static constexpr std::size_t length = 200;
    static constexpr std::size_t reportBytesMaximum = std::size_t{64} << 20U;  ///< of all records together
    static constexpr std::size_t usedMaximum = 10'000;  ///< ids of clients that are not accepted again

    /// A record that is not added to the log.
    [[nodiscard]] static std::shared_ptr<RequestRecord> begin(const Exchange& exchange);
    /// Adds a record. Beyond the length, or if all reports together use too much memory, the oldest requests that have
    /// ended are dropped.
    std::shared_ptr<RequestRecord> add(const Exchange& exchange);
    void add(std::shared_ptr<RequestRecord> record);
    /// Finds a record by its id; upper and lower case are equal.
    [[nodiscard]] const RequestRecord* find(std::string_view id) const;

    /// Withholds the values of this part, which becomes a secret, in all records.
    void hide(const SecretPart& part);

    /// Marks a client's id as used. Returns false if it was used already.
    [[nodiscard]] bool use(std::string_view id);

  private:
    std::deque<std::shared_ptr<RequestRecord>> _records;
    std::deque<std::string> _usedInOrder;
    std::unordered_set<std::string> _used;
};

}  // namespace adminhost
