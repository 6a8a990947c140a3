#include "platform/log/Log.h"

#include "platform/log/QueuedSink.h"
#include "platform/log/StandardError.h"
#include "platform/log/SystemLog.h"

#include <atomic>

namespace adminhost {
namespace {

/// Never destroyed: events may come from destructors at the very end of the process.
QueuedSink& theStandardErrorSink() noexcept {
    static auto& sink = *new QueuedSink(writeToStandardError);
    return sink;
}

std::atomic<LogSink*> currentSink = nullptr;

LogSink& current() noexcept {
    LogSink* sink = currentSink.load();
    return sink == nullptr ? standardErrorSink() : *sink;
}

}  // namespace

LogSink& syslogSink() noexcept {
    static auto& socket = *new SystemLog("/dev/log");
    static auto& sink = *new QueuedSink([](std::string_view line) { return socket.write(line); });
    return sink;
}
LogSink& standardErrorSink() noexcept {
    return theStandardErrorSink();
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
