#pragma once

// One event of the audit: as fields of the journal, and as a line of any log.

#include "adminhostd/Login.h"
#include "adminhostd/Redaction.h"
#include "platform/log/Log.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include <sys/types.h>

namespace adminhost {

/// The journal's MESSAGE_ID of the two kinds of events.
inline constexpr std::string_view begunMessage = "1a8976b99ff945ffac7701626abe7c1b";
inline constexpr std::string_view endedMessage = "0438a259a6154df7a1b771a3b0377388";

/// The account and the process that sent a request, with names as far as they are known.
struct AuditedClient {
    uid_t uid = 0;
    std::string user;
    uid_t login = noLogin;  ///< of its login session
    std::string loginUser;
    pid_t pid = 0;
    std::string unit;
    bool operator==(const AuditedClient&) const = default;
};

/// What a request has changed, or has not done, in the form in which requests report it.
struct AuditedReports {
    Array kept;
    std::size_t reported = 0;  ///< those that were not kept too
};

struct AuditEvent {
    enum class Kind : std::uint8_t {
        begun,       ///< a command that may change something is about to run
        ended,       ///< any request has been answered
        unfinished,  ///< a command of an earlier daemon has begun, and its end was not logged
        cancelled,   ///< a client, which is not always the request's own, has asked for its end
    };
    Kind kind = Kind::ended;
    std::string request;  ///< its id
    std::string plugin;   ///< empty for what the host serves itself
    std::string command;
    std::string access;  ///< the class that it needs; empty if it does not exist
    AuditedClient client;
    bool checkOnly = false;
    unsigned status = 0;  ///< of HTTP; 0 if it is not known
    /// The error's code; for one that is unfinished, what is known of its end; for one that was cancelled, who sent it.
    std::string result;
    double milliseconds = 0;            ///< from arrival to answer
    std::size_t refusalsNotLogged = 0;  ///< earlier ones of this account
    AuditedReports changes;
    AuditedReports notDone;
};

/// Takes the secrets out of every text that a client, a tool or an operation has chosen. Everything is logged in this
/// form.
[[nodiscard]] AuditEvent redacted(AuditEvent event, const Redaction& redaction);

constexpr std::size_t auditTextMaximum = 200;                        ///< bytes of a single text or value
constexpr std::size_t auditReportsMaximum = std::size_t{32} << 10U;  ///< bytes of all reports of an event

/// In the JSON of a report's field: its number in the event, from 1.
inline constexpr std::string_view reportNumber = "n";

/// The fields beside the line itself. Long texts are cut; of many reports only the first are included, the number of
/// all, and the first keys of all, up to a bound.
[[nodiscard]] LogFields fieldsOf(const AuditEvent& event);
/// "adminhostd: request ID PLUGIN/COMMAND by uid 1000 (anna) pid 42: ...", with the first reports.
[[nodiscard]] std::string lineOf(const AuditEvent& event);

/// "settings port: 80 -> 443", or what else a reported change is.
[[nodiscard]] std::string changeText(const Dictionary& change);
/// "cameras.0.users: REASON (WORDS OF THE TOOL)".
[[nodiscard]] std::string notDoneText(const Dictionary& part);

}  // namespace adminhost
