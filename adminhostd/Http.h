#pragma once

// The HTTP side of the front: libmicrohttpd on a listening Unix socket, driven by the front's own loop.

#include "platform/files/FileDescriptor.h"
#include "platform/value/Value.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <list>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include <sys/types.h>

struct MHD_Connection;
struct MHD_Daemon;

namespace adminhost {

constexpr std::size_t bodyMaximum = std::size_t{8} << 20U;  ///< bytes of a request's body

/// The process at the other end, as the kernel knew it when it connected.
struct Peer {
    uid_t uid = static_cast<uid_t>(-1);
    gid_t gid = static_cast<gid_t>(-1);
    pid_t pid = 0;
};

struct HttpAnswer {
    unsigned status = 200;
    std::optional<Value> body;  ///< sent as JSON, or as a property list to a client that asks for one
    std::vector<std::pair<std::string, std::string>> headers;
};

/// One request and the place for its answer. Owned by the server; alive until it has been answered.
class Exchange {
  public:
    Exchange(const Exchange&) = delete;
    Exchange& operator=(const Exchange&) = delete;

    [[nodiscard]] const std::string& id() const noexcept { return _id; }
    [[nodiscard]] const Peer& peer() const noexcept { return _peer; }
    [[nodiscard]] const std::string& method() const noexcept { return _method; }
    [[nodiscard]] const std::string& path() const noexcept { return _path; }  ///< decoded, without the query
    [[nodiscard]] const std::string& body() const noexcept { return _body; }
    // Empty when the client did not send it.
    [[nodiscard]] std::string_view header(const char* name) const;
    [[nodiscard]] std::string_view argument(const char* name) const;  ///< of the address's query, decoded
    /// Gives the body's memory back once it has been read.
    void dropBody() noexcept { std::string().swap(_body); }
    /// Whether the client has closed its connection.
    [[nodiscard]] bool clientGone() const noexcept;
    /// Answers the request, now or later, once. The exchange may be gone when the server runs next.
    void answer(HttpAnswer answer);

  private:
    friend class HttpServer;
    Exchange() = default;

    MHD_Connection* _connection = nullptr;
    int _socket = -1;
    std::string _id;
    Peer _peer;
    std::string _method;
    std::string _path;
    std::string _body;
    std::size_t _received = 0;
    std::optional<HttpAnswer> _refusal;  ///< decided from the head, sent when the body has been read away
    std::optional<HttpAnswer> _answer;
    std::string _bytes;  ///< of the answer, while it is sent
    bool _suspended = false;
};

class HttpServer {
  public:
    /// Called when the head of a request is there: an answer refuses it before its body is read.
    using Head = std::function<std::optional<HttpAnswer>(const Exchange&)>;
    /// Called with the whole request.
    using Serve = std::function<void(Exchange&)>;

    /// Takes the listening socket. A client that takes longer than the time for a request, or to read on, is dropped.
    /// Throws std::runtime_error when the library refuses to start.
    HttpServer(FileDescriptor listener, std::chrono::seconds clientTimeout, Head head, Serve serve);
    HttpServer(const HttpServer&) = delete;
    HttpServer& operator=(const HttpServer&) = delete;
    /// Every exchange must have been answered.
    ~HttpServer();

    /// Becomes readable when run() has something to do.
    [[nodiscard]] int descriptor() const noexcept { return _descriptor; }
    /// Milliseconds until run() must be called; nothing when there is no hurry.
    [[nodiscard]] std::optional<int> timeout() const;
    /// Accepts, reads, serves and sends whatever can be done without waiting.
    void run();
    /// Accepts no further connection; answers the listening socket's end of life.
    void quiesce();
    /// Requests that have begun and are not fully answered.
    [[nodiscard]] std::size_t open() const noexcept { return _open; }

  private:
    struct Client {
        int socket;
        Peer peer;
        bool receiving;
        std::chrono::steady_clock::time_point since;
    };
    struct Callbacks;

    int access(MHD_Connection* connection, const char* url, const char* method, const char* version, const char* data,
               std::size_t* size, Exchange** place);
    int begin(MHD_Connection* connection, const char* url, const char* method, const char* version, Exchange** place);
    int send(Exchange& exchange);
    static Client* clientOf(MHD_Connection* connection);
    void dropSlowClients();

    FileDescriptor _listener;
    std::chrono::seconds _clientTimeout;
    Head _head;
    Serve _serve;
    MHD_Daemon* _daemon = nullptr;
    int _descriptor = -1;
    std::list<Client> _clients;
    std::size_t _open = 0;
    std::string _idPrefix;
    unsigned long _idCount = 0;
};

}  // namespace adminhost
