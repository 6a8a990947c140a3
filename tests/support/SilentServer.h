#pragma once

// A TCP port on loopback that accepts connections and never sends a byte. The kernel completes connections that nobody
// accepts.

#include <stdexcept>

#include <arpa/inet.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <sys/socket.h>
#include <unistd.h>

namespace adminhost::test {

class SilentServer {
  public:
    SilentServer() : _socket(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        socklen_t size = sizeof address;
        constexpr int backlog = 100;
        if (::bind(_socket, reinterpret_cast<sockaddr*>(&address), size) != 0 || ::listen(_socket, backlog) != 0 ||
            ::getsockname(_socket, reinterpret_cast<sockaddr*>(&address), &size) != 0) {
            ::close(_socket);
            throw std::runtime_error("cannot listen on loopback");
        }
        _port = ntohs(address.sin_port);
    }
    SilentServer(const SilentServer&) = delete;
    SilentServer& operator=(const SilentServer&) = delete;
    ~SilentServer() { ::close(_socket); }

    [[nodiscard]] int port() const noexcept { return _port; }
    /// The listening socket.
    [[nodiscard]] int socket() const noexcept { return _socket; }
    /// The number of connections that clients have made since the last call. They are closed.
    [[nodiscard]] int connections() const {
        int count = 0;
        ::fcntl(_socket, F_SETFL, O_NONBLOCK);
        for (int accepted = ::accept(_socket, nullptr, nullptr); accepted >= 0;
             accepted = ::accept(_socket, nullptr, nullptr)) {
            ::close(accepted);
            ++count;
        }
        return count;
    }

  private:
    int _socket;
    int _port = 0;
};

}  // namespace adminhost::test
