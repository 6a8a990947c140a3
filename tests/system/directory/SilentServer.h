#pragma once

// A TCP port on loopback that accepts connections and never sends a byte.

#include <stdexcept>

#include <arpa/inet.h>
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
        constexpr int backlog = 64;  // the kernel completes connections that nobody accepts
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

  private:
    int _socket;
    int _port = 0;
};

}  // namespace adminhost::test
