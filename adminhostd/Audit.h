#pragma once

// The audit: who has asked for what, what it has changed, and how it ended.
//
// A command that may change something has two events, one before it runs and one when it has ended. Every other request
// that the worker serves, every request that is not permitted, and every refused POST whose body did not exceed the
// bound of its bytes has one event when it has been answered. Events are written to the
// log's journal with fields, or to the log as lines (platform/log/Log.h). Writing never blocks: what cannot be written
// is counted, and the request goes on.

#include "adminhostd/AccountNames.h"
#include "adminhostd/AuditEvent.h"
#include "adminhostd/Protocol.h"
#include "adminhostd/RequestLog.h"
#include "platform/framework/Plugin.h"

#include <chrono>
#include <cstddef>
#include <map>
#include <string>
#include <utility>

#include <sys/types.h>

namespace adminhost {

class Audit {
  public:
    static constexpr std::size_t refusalsLogged = 20;     ///< of one account in one minute; further ones are counted
    static constexpr std::size_t refusedAccounts = 1000;  ///< whose refusals are counted at a time

    /// Names of accounts for messages.
    [[nodiscard]] AccountNames& names() noexcept { return _names; }

    /// The request's operation is about to run.
    void begun(RequestRecord& record, const protocol::Begun& about);
    /// The request has been answered. Clears the secrets that its record knew.
    void ended(RequestRecord& record);
    /// A request of an earlier daemon that had begun, and whose end that daemon has not logged.
    void unfinished(const protocol::Unfinished& request);

    /// The event for a client's try to cancel this request, without its result.
    [[nodiscard]] AuditEvent cancellation(const Peer& peer, const RequestRecord& record);
    /// The try has succeeded, or the client may not cancel that request.
    void cancelled(AuditEvent event, unsigned status, const std::string& code);

    /// Whether everything could be recorded.
    [[nodiscard]] Diagnosis check() const;

  private:
    using Clock = std::chrono::steady_clock;
    struct Refusals {
        Clock::time_point since;
        std::size_t logged = 0;
        std::size_t notLogged = 0;
    };

    [[nodiscard]] AuditedClient clientOf(const Peer& peer);
    [[nodiscard]] AuditEvent eventFor(const RequestRecord& record, AuditEvent::Kind kind);
    static void write(const AuditEvent& event, const Redaction& redaction);
    /// Counts a refusal. Returns false if it is not to be logged, because the account has caused too many.
    [[nodiscard]] bool countRefusal(uid_t uid, std::size_t& notLogged);
    void forgetOldestRefusals();
    /// Returns true for the account's first reading of this place in an hour.
    [[nodiscard]] bool countReading(uid_t uid, const std::string& place);
    [[nodiscard]] bool isWorthLogging(const RequestRecord& record, std::size_t& notLogged);

    AccountNames _names;
    std::map<uid_t, Refusals> _refusals;
    std::map<std::pair<uid_t, std::string>, Clock::time_point> _readings;  ///< of logs and of the audit
    std::size_t _unrecorded = 0;  ///< changes that began without a note for the next daemon
    std::string _unrecordedReason;
};

}  // namespace adminhost
