#include "platform/log/Log.h"

#include "platform/log/JournalSocket.h"
#include "platform/log/QueuedSink.h"
#include "platform/log/StandardError.h"
#include "platform/log/SystemLog.h"

#include <atomic>
#include <utility>

namespace adminhost {
namespace {

/// Holds an object that is never destroyed: events may come from destructors at the very end of the process.
template <class T>
union Lasting {
    template <class... Arguments>
    explicit Lasting(Arguments&&... arguments) : object(std::forward<Arguments>(arguments)...) {}
    Lasting(const Lasting&) = delete;
    Lasting& operator=(const Lasting&) = delete;
    ~Lasting() {}  // NOLINT(modernize-use-equals-default): a default one would be deleted

    T object;
};

std::atomic<LogSink*> currentSink = nullptr;

QueuedSink& syslogQueue() noexcept {
    static Lasting<SystemLog> socket("/dev/log");
    static Lasting<QueuedSink> sink([](std::string_view text) { return socket.object.write(text); });
    return sink.object;
}

QueuedSink& standardErrorQueue() noexcept {
    static Lasting<QueuedSink> sink(writeToStandardError);
    return sink.object;
}

JournalSocket& journal() noexcept {
    static Lasting<JournalSocket> socket("/run/systemd/journal/socket");
    return socket.object;
}

/// Returns true if what the sink writes is in the journal already: /dev/log is the journal's where it runs, and a
/// service manager may have connected standard error to it.
bool endsInTheJournal(const LogSink& sink) {
    return &sink == &syslogQueue() || (&sink == &standardErrorQueue() && standardErrorIsTheJournal());
}

LogSink& current() noexcept {
    LogSink* sink = currentSink.load();
    return sink == nullptr ? standardErrorSink() : *sink;
}

}  // namespace

LogSink& syslogSink() noexcept {
    return syslogQueue();
}
LogSink& standardErrorSink() noexcept {
    return standardErrorQueue();
}
void setLogSink(LogSink& sink) noexcept {
    currentSink = &sink;
}
void logEvent(std::string_view event) noexcept {
    current().write(event);
}
void logEntry(std::string_view event, const LogFields& fields) noexcept {
    LogSink& sink = current();
    bool written = false;
    try {
        written = journal().write(logTextOf(event), fields);
    } catch (...) {
        written = false;  // no memory left; the sink counts what it loses
    }
    if (!written || !endsInTheJournal(sink)) {
        sink.write(event);
    }
}
bool journalIsThere() noexcept {
    try {
        return journal().isThere();
    } catch (...) {
        return false;
    }
}
std::size_t lostEvents() noexcept {
    return journal().lostInTotal() + syslogQueue().lostInTotal() + standardErrorQueue().lostInTotal();
}
bool flushLog() noexcept {
    bool whole = current().flush();
    try {
        whole = journal().flush() && whole;
    } catch (...) {
        whole = false;
    }
    return whole;
}

}  // namespace adminhost
