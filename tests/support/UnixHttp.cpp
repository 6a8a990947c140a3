#include "tests/support/UnixHttp.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <stdexcept>
#include <utility>

#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

[[noreturn]] void fail(const std::string& what) {
    throw std::runtime_error(what + ": " + std::strerror(errno));
}

std::string lowered(std::string text) {
    std::transform(text.begin(), text.end(), text.begin(),
                   [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; });
    return text;
}

}  // namespace

UnixHttp::UnixHttp(const std::string& path, std::chrono::milliseconds timeout)
    : _socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.size() >= sizeof address.sun_path) {
        throw std::runtime_error("the path is too long: " + path);
    }
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    const timeval bound{timeout.count() / 1000, timeout.count() % 1000 * 1000};
    ::setsockopt(_socket, SOL_SOCKET, SO_RCVTIMEO, &bound, sizeof bound);
    ::setsockopt(_socket, SOL_SOCKET, SO_SNDTIMEO, &bound, sizeof bound);
    if (::connect(_socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        const int failure = errno;
        close();
        errno = failure;
        fail("cannot connect to " + path);
    }
}

UnixHttp::UnixHttp(UnixHttp&& other) noexcept
    : _socket(std::exchange(other._socket, -1)), _unread(std::move(other._unread)) {}

UnixHttp::~UnixHttp() {
    close();
}

void UnixHttp::close() {
    if (_socket >= 0) {
        ::close(std::exchange(_socket, -1));
    }
}

void UnixHttp::send(std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t sent = ::send(_socket, bytes.data(), bytes.size(), MSG_NOSIGNAL);
        if (sent < 0) {
            fail("cannot send");
        }
        bytes.remove_prefix(static_cast<std::size_t>(sent));
    }
}

void UnixHttp::begin(std::string_view method, std::string_view target, std::string_view body, const Headers& headers) {
    std::string text = std::string(method) + ' ' + std::string(target) + " HTTP/1.1\r\nHost: localhost\r\n";
    for (const std::string& header : headers) {
        text += header + "\r\n";
    }
    if (method == "POST" || !body.empty()) {
        text += "Content-Length: " + std::to_string(body.size()) + "\r\n";
    }
    send(text + "\r\n" + std::string(body));
}

bool UnixHttp::fill() {
    char buffer[16 << 10];
    const ssize_t count = ::recv(_socket, buffer, sizeof buffer, 0);
    if (count < 0) {
        fail("no answer");
    }
    _unread.append(buffer, static_cast<std::size_t>(count));
    return count > 0;
}

HttpReply UnixHttp::reply(bool headOnly) {
    std::size_t end = 0;
    while ((end = _unread.find("\r\n\r\n")) == std::string::npos) {
        if (!fill()) {
            throw std::runtime_error("the connection was closed before an answer: " + _unread);
        }
    }
    HttpReply reply;
    const std::string head = _unread.substr(0, end + 2);
    _unread.erase(0, end + 4);
    reply.status = std::stoi(head.substr(head.find(' ') + 1));
    for (std::size_t at = head.find("\r\n") + 2; at < head.size(); at = head.find("\r\n", at) + 2) {
        const std::string line = head.substr(at, head.find("\r\n", at) - at);
        const std::size_t colon = line.find(':');
        reply.headers[lowered(line.substr(0, colon))] = line.substr(line.find_first_not_of(' ', colon + 1));
    }
    if (reply.status == 100) {
        return this->reply(headOnly);
    }
    const auto length = reply.headers.find("content-length");
    const std::size_t size = length == reply.headers.end() || headOnly ? 0 : std::stoul(length->second);
    while (_unread.size() < size) {
        if (!fill()) {
            throw std::runtime_error("the connection was closed inside an answer");
        }
    }
    reply.body = _unread.substr(0, size);
    _unread.erase(0, size);
    return reply;
}

HttpReply UnixHttp::request(std::string_view method, std::string_view target, std::string_view body,
                            const Headers& headers) {
    begin(method, target, body, headers);
    return reply(method == "HEAD");
}

bool UnixHttp::closedWithin(std::chrono::milliseconds time) {
    const auto end = std::chrono::steady_clock::now() + time;
    for (;;) {
        const auto left = std::chrono::ceil<std::chrono::milliseconds>(end - std::chrono::steady_clock::now()).count();
        pollfd entry{_socket, POLLIN, 0};
        if (left < 0 || ::poll(&entry, 1, static_cast<int>(left)) != 1) {
            return false;
        }
        char buffer[1024];
        const ssize_t count = ::recv(_socket, buffer, sizeof buffer, 0);
        if (count <= 0) {
            return true;
        }
        _unread.append(buffer, static_cast<std::size_t>(count));
    }
}

std::size_t UnixHttp::readSome(std::size_t bytes) {
    std::string buffer(bytes, '\0');
    const ssize_t count = ::recv(_socket, buffer.data(), buffer.size(), 0);
    return count < 0 ? 0 : static_cast<std::size_t>(count);
}

}  // namespace adminhost::test
