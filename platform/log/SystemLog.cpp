#include "platform/log/SystemLog.h"

#include "platform/log/DatagramSocket.h"
#include "platform/text/Utf8.h"

#include <array>
#include <cerrno>
#include <cstring>
#include <ctime>

#include <fmt/format.h>
#include <sys/socket.h>
#include <syslog.h>

namespace adminhost {
namespace {

constexpr std::size_t cutSize = std::size_t{64} << 10U;  ///< bytes of a text that is too long for the socket

/// The place where the text may be cut without damaging a character.
std::string_view cut(std::string_view text) {
    std::size_t size = cutSize;
    while (size > 0 && continuesCharacter(text[size])) {
        --size;
    }
    return text.substr(0, size);
}

std::string messageOf(std::string_view text) {
    // In English, whatever the locale: it is part of the format.
    constexpr std::array<const char*, 12> months{"Jan", "Feb", "Mar", "Apr", "May", "Jun",
                                                 "Jul", "Aug", "Sep", "Oct", "Nov", "Dec"};
    const std::time_t now = std::time(nullptr);
    std::tm parts{};
    ::localtime_r(&now, &parts);
    return fmt::format("<{}>{} {:2} {:02}:{:02}:{:02} {}: {}", LOG_DAEMON | LOG_NOTICE,
                       months.at(static_cast<std::size_t>(parts.tm_mon)), parts.tm_mday, parts.tm_hour, parts.tm_min,
                       parts.tm_sec, ::program_invocation_short_name, text);
}

}  // namespace

bool SystemLog::connect() {
    _socket = datagramSocketTo(_path);
    return _socket.isOpen();
}

QueuedSink::Written SystemLog::write(std::string_view text) {
    if (text.ends_with('\n')) {
        text.remove_suffix(1);
    }
    std::string message = messageOf(text);
    // A second try for a reader that was restarted, and one for a text that is too long.
    for (int tries = 0; tries < 3; ++tries) {
        if (!_socket.isOpen() && !connect()) {
            return {QueuedSink::Outcome::later};
        }
        if (::send(_socket.get(), message.data(), message.size(), MSG_DONTWAIT | MSG_NOSIGNAL) >= 0) {
            return {QueuedSink::Outcome::written};
        }
        if (errno == EMSGSIZE && text.size() > cutSize) {
            const std::string_view kept = cut(text);
            message = messageOf(fmt::format("{} ({} more bytes)", kept, text.size() - kept.size()));
            text = {};
        } else if (errno == EMSGSIZE) {
            return {QueuedSink::Outcome::failed};
        } else if (errno == EAGAIN || errno == ENOBUFS) {
            return {QueuedSink::Outcome::later};
        } else if (errno != EINTR) {
            _socket.close();
        }
    }
    return {QueuedSink::Outcome::later};
}

}  // namespace adminhost
