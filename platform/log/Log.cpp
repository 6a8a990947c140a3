#include "platform/log/Log.h"

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

LogSink& current() noexcept {
    LogSink* sink = currentSink.load();
    return sink == nullptr ? standardErrorSink() : *sink;
}

}  // namespace

LogSink& syslogSink() noexcept {
    static Lasting<SystemLog> socket("/dev/log");
    static Lasting<QueuedSink> sink([](std::string_view text) { return socket.object.write(text); });
    return sink.object;
}
LogSink& standardErrorSink() noexcept {
    static Lasting<QueuedSink> sink(writeToStandardError);
    return sink.object;
}
void setLogSink(LogSink& sink) noexcept {
    currentSink = &sink;
}
void logEvent(std::string_view event) noexcept {
    current().write(event);
}
bool flushLog() noexcept {
    return current().flush();
}

}  // namespace adminhost
