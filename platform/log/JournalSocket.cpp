#include "platform/log/JournalSocket.h"

#include "platform/log/DatagramSocket.h"

#include <cerrno>
#include <cstdint>

#include <sys/socket.h>
#include <syslog.h>

namespace adminhost {
namespace {

void append(std::string& datagram, std::string_view name, std::string_view value) {
    datagram += name;
    if (value.find('\n') == std::string_view::npos) {
        datagram.append(1, '=').append(value);
    } else {
        datagram += '\n';
        for (unsigned shift = 0; shift < 64; shift += 8) {
            datagram += static_cast<char>((std::uint64_t{value.size()} >> shift) & 0xffU);
        }
        datagram += value;
    }
    datagram += '\n';
}

}  // namespace

std::string journalDatagramOf(std::string_view message, const LogFields& fields) {
    std::string datagram;
    append(datagram, "MESSAGE", message);
    append(datagram, "PRIORITY", std::to_string(LOG_NOTICE));
    append(datagram, "SYSLOG_FACILITY", std::to_string(LOG_FAC(LOG_DAEMON)));
    append(datagram, "SYSLOG_IDENTIFIER", ::program_invocation_short_name);
    for (const auto& [name, value] : fields) {
        append(datagram, name, value);
    }
    return datagram;
}

bool JournalSocket::connect() {
    const auto now = std::chrono::steady_clock::now();
    if (now < _lookFrom) {
        return false;
    }
    _socket = datagramSocketTo(_path);
    if (!_socket.isOpen()) {
        _lookFrom = now + _pause;
    }
    return _socket.isOpen();
}

JournalSocket::Sent JournalSocket::send(const std::string& datagram) {
    if (datagram.size() > entryMaximum) {
        return Sent::never;
    }
    // A second try for a journal that was restarted.
    for (int tries = 0; tries < 2; ++tries) {
        if (!_socket.isOpen() && !connect()) {
            return Sent::nobodyListens;
        }
        if (::send(_socket.get(), datagram.data(), datagram.size(), MSG_DONTWAIT | MSG_NOSIGNAL) >= 0) {
            return Sent::yes;
        }
        if (errno == EMSGSIZE) {
            return Sent::never;
        }
        if (errno == EAGAIN || errno == ENOBUFS || errno == EINTR) {
            return Sent::later;
        }
        _socket.close();
    }
    return Sent::nobodyListens;
}

bool JournalSocket::drain() {
    while (!_queue.empty()) {
        const Sent sent = send(_queue.front());
        if (sent == Sent::later) {
            return false;
        }
        _lost += sent == Sent::yes ? 0 : 1;
        _bytes -= _queue.front().size();
        _queue.pop_front();
    }
    return true;
}

bool JournalSocket::write(std::string_view message, const LogFields& fields) {
    const std::lock_guard lock(_mutex);
    std::string datagram = journalDatagramOf(message, fields);
    const Sent sent = drain() ? send(datagram) : Sent::later;
    if (sent == Sent::later && _bytes + datagram.size() <= queueMaximum) {
        _bytes += datagram.size();
        _queue.push_back(std::move(datagram));
    } else if (sent == Sent::later || sent == Sent::never) {
        ++_lost;
    }
    return sent != Sent::nobodyListens;
}

bool JournalSocket::flush() {
    const std::lock_guard lock(_mutex);
    return drain();
}

bool JournalSocket::isThere() {
    const std::lock_guard lock(_mutex);
    return datagramSocketTo(_path).isOpen();
}

std::size_t JournalSocket::lostInTotal() const {
    const std::lock_guard lock(_mutex);
    return _lost;
}

}  // namespace adminhost
