#pragma once

// The system log: one call per event, the text exactly as given. Platform rooms do not log; who calls them does.

#include <functional>
#include <string_view>

namespace adminhost {

/// Where events go. Called on the thread that logs; must not throw.
class LogSink {
  public:
    virtual ~LogSink() = default;
    virtual void write(std::string_view event) noexcept = 0;
};

/// syslog(3), facility daemon, priority notice. Line feeds inside an event stay in it, as syslog escapes them.
[[nodiscard]] LogSink& syslogSink() noexcept;
/// Standard error, a line feed after each event.
[[nodiscard]] LogSink& standardErrorSink() noexcept;

/// Sets the process's sink; the caller keeps ownership and keeps it alive. The first sink is standardErrorSink().
void setLogSink(LogSink& sink) noexcept;
/// Logs one event.
void logEvent(std::string_view event) noexcept;

}  // namespace adminhost
