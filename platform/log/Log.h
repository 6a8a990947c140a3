#pragma once

// The system log: one call for each event. The rooms of platform/ do not log; their callers do.
//
// Every sink writes the text as logTextOf() returns it, so that a name, a value or the output of a tool cannot look
// like a separate event. No sink ever blocks: text that cannot be written at once waits in a queue of 1 MiB. Events
// beyond it are lost, and their number is logged as soon as the log can be written again.

#include "platform/framework/Export.h"

#include <cstddef>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace adminhost {

/// Where events go. Called on the thread that logs; must not throw and must not block.
class ADMINHOST_EXPORT LogSink {
  public:
    virtual ~LogSink() = default;
    virtual void write(std::string_view event) noexcept = 0;
    /// Tries to write what is still queued; returns true when nothing is left.
    virtual bool flush() noexcept { return true; }
};

/// The text of an event as it is logged. A text without control characters is returned as it is. The lines after the
/// first are indented by four blanks, line feeds at the end are left out. Other control characters (C0 with the tab,
/// DEL, C1) and bytes that are not UTF-8 are escaped: "\t", "\r", "\x1b", "\u0085".
[[nodiscard]] ADMINHOST_EXPORT std::string logTextOf(std::string_view event);

/// The syslog socket /dev/log, which is the journal's where it runs: facility daemon, priority notice, one message for
/// each event. A text beyond what the socket accepts is cut, with the number of omitted bytes.
[[nodiscard]] ADMINHOST_EXPORT LogSink& syslogSink() noexcept;
/// Standard error, with a line feed after each event.
[[nodiscard]] ADMINHOST_EXPORT LogSink& standardErrorSink() noexcept;

/// Sets the process's sink; the caller keeps ownership and keeps it alive. The first sink is standardErrorSink().
ADMINHOST_EXPORT void setLogSink(LogSink& sink) noexcept;
/// Logs one event.
ADMINHOST_EXPORT void logEvent(std::string_view event) noexcept;
/// Fields of an entry of the journal: names in capitals, with any values.
using LogFields = std::vector<std::pair<std::string, std::string>>;
/// Logs one event with fields. Where the journal runs, it is an entry with these fields; the sink gets the event too,
/// unless its output ends in the same journal. Elsewhere the sink alone gets the event.
ADMINHOST_EXPORT void logEntry(std::string_view event, const LogFields& fields) noexcept;
/// Returns true if the journal runs, so that logEntry() writes fields.
[[nodiscard]] ADMINHOST_EXPORT bool journalIsThere() noexcept;
/// The number of events that could not be logged since the start of the process, apart from those of other sinks than
/// the two above.
[[nodiscard]] ADMINHOST_EXPORT std::size_t lostEvents() noexcept;
/// Tries to write what the process's sink and the journal have queued; returns true when nothing is left. To be called
/// from time to time while it returns false: without it, queued events wait for the next one.
ADMINHOST_EXPORT bool flushLog() noexcept;

}  // namespace adminhost
