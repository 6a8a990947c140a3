#pragma once

// A small HTTP/1.1 client on a Unix socket for tests, with one connection per object. It can also send malformed
// requests. Everything waits ten seconds at most (or the given time) and then throws std::runtime_error.

#include <chrono>
#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::test {

struct HttpReply {
    int status = 0;
    std::map<std::string, std::string> headers;  ///< names in lower case
    std::string body;
};

class UnixHttp {
  public:
    using Headers = std::vector<std::string>;  ///< "Name: value"

    explicit UnixHttp(const std::string& path, std::chrono::milliseconds timeout = std::chrono::seconds(10));
    /// Takes over a connected socket, whose waits are not bounded.
    explicit UnixHttp(int socket) noexcept : _socket(socket) {}
    UnixHttp(UnixHttp&& other) noexcept;
    UnixHttp(const UnixHttp&) = delete;
    UnixHttp& operator=(const UnixHttp&) = delete;
    ~UnixHttp();

    /// Sends a request with its Content-Length and reads the reply; the connection can be used again.
    HttpReply request(std::string_view method, std::string_view target, std::string_view body = "",
                      const Headers& headers = {});
    HttpReply get(std::string_view target) { return request("GET", target); }
    HttpReply post(std::string_view target, std::string_view body = "", const Headers& headers = {}) {
        return request("POST", target, body, headers);
    }

    /// The two halves of request(), and raw bytes.
    void begin(std::string_view method, std::string_view target, std::string_view body = "",
               const Headers& headers = {});
    void send(std::string_view bytes);
    HttpReply reply(bool headOnly = false);
    /// Returns true if the server closes the connection within this time.
    bool closedWithin(std::chrono::milliseconds time);
    /// Reads at most so many bytes that have arrived or arrive within ten seconds, and drops them. Returns their
    /// number; 0 if the server has closed the connection.
    std::size_t readSome(std::size_t bytes);
    void close();

  private:
    bool fill();

    int _socket = -1;
    std::string _unread;
};

}  // namespace adminhost::test
