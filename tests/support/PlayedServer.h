#pragma once

// A server on a Unix socket that a test plays: an HTTP daemon of another version, or one that is slow.

#include <atomic>
#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <functional>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost::test {

/// Sends the answer that a function returns for each request, and closes the connection if it returns none.
class PlayedServer {
  public:
    /// With a pause, which follows each byte, the answers are sent byte by byte.
    explicit PlayedServer(std::function<std::string(const std::string& request)> answer,
                          std::chrono::microseconds pause = std::chrono::microseconds(0))
        : _answer(std::move(answer)), _pause(pause) {
        std::string pattern = (std::filesystem::temp_directory_path() / "played.XXXXXX").string();
        _directory = ::mkdtemp(pattern.data());
        _listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path().copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(::bind(_listener, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(::listen(_listener, 8), 0);
        _thread = std::thread([this] { serve(); });
    }
    ~PlayedServer() {
        _ended = true;
        _thread.join();
        ::close(_listener);
        std::filesystem::remove_all(_directory);
    }
    PlayedServer(const PlayedServer&) = delete;
    PlayedServer& operator=(const PlayedServer&) = delete;

    [[nodiscard]] std::string path() const { return _directory + "/socket"; }
    /// The requests so far. To be called only after the client has its answer or its failure.
    [[nodiscard]] std::vector<std::string> requests() const { return _requests; }

    /// A reply with this body.
    [[nodiscard]] static std::string reply(const std::string& body, const std::string& headers = {}) {
        return "HTTP/1.1 200 OK\r\n" + headers + "Content-Length: " + std::to_string(body.size()) + "\r\n\r\n" + body;
    }

  private:
    /// The length that the head of a request names.
    static std::size_t bodyLengthOf(const std::string& head) {
        constexpr std::string_view name = "Content-Length: ";
        const std::size_t at = head.find(name);
        return at == std::string::npos ? 0 : std::strtoul(head.c_str() + at + name.size(), nullptr, 10);
    }
    /// A whole request; empty if the client has closed the connection.
    static std::string requestFrom(int client) {
        std::string request;
        char bytes[4096];
        while (true) {
            const std::size_t head = request.find("\r\n\r\n");
            if (head != std::string::npos && request.size() >= head + 4 + bodyLengthOf(request.substr(0, head))) {
                return request;
            }
            const ssize_t count = ::read(client, bytes, sizeof bytes);
            if (count <= 0) {
                return {};
            }
            request.append(bytes, static_cast<std::size_t>(count));
        }
    }
    bool send(int client, std::string_view answer) const {
        while (!answer.empty() && !_ended) {
            const std::size_t size = _pause.count() == 0 ? answer.size() : 1;
            const ssize_t sent = ::send(client, answer.data(), size, MSG_NOSIGNAL);
            if (sent < 0) {
                return false;
            }
            answer.remove_prefix(static_cast<std::size_t>(sent));
            std::this_thread::sleep_for(_pause);
        }
        return true;
    }
    void serve() {
        int client = -1;
        while (!_ended) {
            pollfd entries[2] = {{_listener, POLLIN, 0}, {client, POLLIN, 0}};
            if (::poll(entries, client < 0 ? 1 : 2, 20) <= 0) {
                continue;
            }
            if ((entries[0].revents & POLLIN) != 0) {
                ::close(client);
                client = ::accept4(_listener, nullptr, nullptr, SOCK_CLOEXEC);
                continue;
            }
            const std::string request = requestFrom(client);
            if (!request.empty()) {
                _requests.push_back(request);
            }
            const std::string answer = request.empty() ? "" : _answer(request);
            if (answer.empty() || !send(client, answer)) {
                ::close(client);
                client = -1;
            }
        }
        ::close(client);
    }

    std::function<std::string(const std::string&)> _answer;
    std::chrono::microseconds _pause;
    std::string _directory;
    int _listener = -1;
    std::atomic<bool> _ended = false;
    std::vector<std::string> _requests;
    std::thread _thread;
};

}  // namespace adminhost::test
