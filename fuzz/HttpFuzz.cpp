// The bytes of a client, in two pieces on a real connection of the front's server. What is served has a well-formed
// head and a body within its bound, and the body and the headers go through their readers. What is sent back is HTTP.

#include "adminhostd/Http.h"
#include "adminhostd/RequestBody.h"
#include "platform/json/Json.h"

#include <array>
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <string>
#include <string_view>

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

using namespace adminhost;

void require(bool condition) {
    if (!condition) {
        std::abort();
    }
}

/// What the front does with a request, without its operations.
void serve(Exchange& exchange) {
    require(!exchange.headProblem() && exchange.body().size() <= RequestBounds().bodyBytes && !exchange.path().empty());
    static_cast<void>(revisionsOf(exchange.header("If-Match").value_or("*")));
    static_cast<void>(deadlineOf(exchange.header("Request-Deadline").value_or("1")));
    static_cast<void>(exchange.wantsPropertyList());
    static_cast<void>(exchange.argument("after"));
    HttpAnswer answer;
    if (const auto form = bodyFormOf(exchange.header("Content-Type").value_or(""))) {
        if (auto request = requestOf(exchange.body(), *form)) {
            answer.body = Value(*std::move(request));
        } else {
            require(!request.error().text.empty());
            answer.status = 400;
        }
    }
    exchange.dropBody();
    exchange.answer(std::move(answer));
}

/// A server at an address without a file, and connections to it.
class Server {
  public:
    Server() {
        FileDescriptor listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        // Binding the family alone has the kernel choose an abstract address.
        require(::bind(listener.get(), reinterpret_cast<sockaddr*>(&address), sizeof(sa_family_t)) == 0);
        _size = sizeof _address;
        require(::getsockname(listener.get(), reinterpret_cast<sockaddr*>(&_address), &_size) == 0 &&
                ::listen(listener.get(), 16) == 0);
        _server = std::make_unique<HttpServer>(std::move(listener), RequestBounds(),
                                               [](Exchange& exchange) -> std::variant<HttpAnswer, HttpServer::Serve> {
                                                   if (exchange.headProblem()) {
                                                       return *exchange.headProblem();
                                                   }
                                                   return serve;
                                               });
    }

    [[nodiscard]] FileDescriptor connect() const {
        FileDescriptor client(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
        require(::connect(client.get(), reinterpret_cast<const sockaddr*>(&_address), _size) == 0);
        return client;
    }

    /// Runs until nothing is left to do without waiting for the client.
    void settle() {
        for (;;) {
            std::vector<pollfd> entries;
            _server->addTo(entries);
            const bool ready = ::poll(entries.data(), entries.size(), 0) > 0;
            if (!ready && _server->timeout() != 0) {
                return;
            }
            static_cast<void>(_server->run(entries));
        }
    }

    [[nodiscard]] std::size_t open() const { return _server->open(); }

  private:
    sockaddr_un _address{};
    socklen_t _size = 0;
    std::unique_ptr<HttpServer> _server;
};

/// Reads what is there; false at the end of the connection.
bool readSome(int client, std::string& text) {
    std::array<char, 16384> buffer;
    const ssize_t count = ::recv(client, buffer.data(), buffer.size(), MSG_DONTWAIT);
    if (count > 0) {
        text.append(buffer.data(), static_cast<std::size_t>(count));
    }
    return count > 0;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    static Server server;
    const std::string_view bytes(reinterpret_cast<const char*>(data), size);
    std::string answers;
    {
        const FileDescriptor client = server.connect();
        for (const std::string_view piece : {bytes.substr(0, size / 2), bytes.substr(size / 2)}) {
            static_cast<void>(::send(client.get(), piece.data(), piece.size(), MSG_NOSIGNAL | MSG_DONTWAIT));
            server.settle();
            while (readSome(client.get(), answers)) {
                server.settle();
            }
        }
        ::shutdown(client.get(), SHUT_WR);
        server.settle();
        while (readSome(client.get(), answers)) {
            server.settle();
        }
    }
    server.settle();
    require(answers.empty() || answers.starts_with("HTTP/1."));
    require(server.open() == 0);
    return 0;
}
