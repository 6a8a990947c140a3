#include "platform/log/Log.h"

#include <atomic>
#include <cerrno>
#include <string>

#include <syslog.h>
#include <unistd.h>

namespace adminhost {
namespace {

class SyslogSink final : public LogSink {
  public:
    void write(std::string_view event) noexcept override {
        ::syslog(LOG_DAEMON | LOG_NOTICE, "%.*s", static_cast<int>(event.size()), event.data());
    }
};

class StandardErrorSink final : public LogSink {
  public:
    void write(std::string_view event) noexcept override {
        std::string line;
        try {
            line.assign(event).push_back('\n');
        } catch (...) {
            return;
        }
        const char* at = line.data();
        std::size_t left = line.size();
        while (left > 0) {
            const ssize_t written = ::write(STDERR_FILENO, at, left);
            if (written < 0) {
                if (errno == EINTR) {
                    continue;
                }
                return;
            }
            at += written;
            left -= static_cast<std::size_t>(written);
        }
    }
};

SyslogSink theSyslogSink;
StandardErrorSink theStandardErrorSink;
std::atomic<LogSink*> currentSink = &theStandardErrorSink;

}  // namespace

LogSink& syslogSink() noexcept {
    return theSyslogSink;
}
LogSink& standardErrorSink() noexcept {
    return theStandardErrorSink;
}
void setLogSink(LogSink& sink) noexcept {
    currentSink = &sink;
}
void logEvent(std::string_view event) noexcept {
    currentSink.load()->write(event);
}

}  // namespace adminhost
