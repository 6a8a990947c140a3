#pragma once

// The HTTP side of the front: accepts connections on a Unix socket and hands them to libmicrohttpd, which the front's
// own loop drives.

#include "adminhostd/ConnectionLimits.h"
#include "adminhostd/Peer.h"
#include "adminhostd/RequestBounds.h"
#include "platform/files/FileDescriptor.h"
#include "platform/value/Value.h"

#include <chrono>
#include <cstddef>
#include <functional>
#include <list>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <utility>
#include <variant>
#include <vector>

#include <poll.h>
#include <sys/types.h>

struct MHD_Connection;
struct MHD_Daemon;

namespace adminhost {

/// Bytes of all answers that clients have not read yet. Above it, the oldest of them is dropped with its connection.
/// The newest never is, so that an answer of any size arrives.
constexpr std::size_t unreadMaximum = std::size_t{64} << 20U;

/// The text of an answer, in the form that its client prefers (Exchange::wantsPropertyList()).
struct AnswerText {
    std::shared_ptr<const std::string> bytes;  ///< identical requests have one text
    const char* type = "application/json";
    std::size_t clients = 1;  ///< to which this text is sent; each counts as a holder of its part
};

struct HttpAnswer {
    unsigned status = 200;
    std::optional<Value> body;  ///< sent as JSON, or as a property list to a client that asks for one
    std::vector<std::pair<std::string, std::string>> headers;
    std::optional<AnswerText> text = std::nullopt;  ///< sent as it is, instead of a body
};

class HttpServer;

/// One request and the place for its answer. Owned by the server; alive until it has been answered.
class Exchange {
  public:
    Exchange(const Exchange&) = delete;
    Exchange& operator=(const Exchange&) = delete;

    [[nodiscard]] const std::string& id() const noexcept { return _id; }
    [[nodiscard]] const Peer& peer() const noexcept { return *_peer; }
    [[nodiscard]] const std::string& method() const noexcept { return _method; }
    [[nodiscard]] const std::string& path() const noexcept { return _path; }  ///< decoded, without the query
    [[nodiscard]] const std::string& body() const noexcept { return _body; }
    /// Returns nullopt if the client did not send the header, and an empty text if it sent an empty one. A NUL ends the
    /// text.
    [[nodiscard]] std::optional<std::string_view> header(const char* name) const;
    /// A value of the address's query, decoded; empty if the client did not send it.
    [[nodiscard]] std::string_view argument(const char* name) const;
    /// The answer to a head that has an error or can be read in more than one way; nullopt if it is well-formed.
    [[nodiscard]] const std::optional<HttpAnswer>& headProblem() const noexcept { return _headProblem; }
    /// Returns true if the address's query has this name, with or without a value.
    [[nodiscard]] bool hasArgument(std::string_view name) const;
    /// Returns true if the answer's text is to be a property list, and false for JSON.
    [[nodiscard]] bool wantsPropertyList() const;
    /// Replaces the id by the client's own.
    void adoptId(std::string id) noexcept { _id = std::move(id); }
    /// Clears and frees the body once it has been read.
    void dropBody() noexcept;
    /// Returns true if the client has closed its connection, or its sending half.
    [[nodiscard]] bool clientGone() const noexcept;
    /// Sends the answer, now or later. Must be called once. The exchange may be gone when the server runs next.
    void answer(HttpAnswer answer);

  private:
    friend HttpServer;
    explicit Exchange(HttpServer& server) noexcept : _server(server) {}

    HttpServer& _server;
    MHD_Connection* _connection = nullptr;
    int _socket = -1;
    std::string _id;
    std::shared_ptr<const Peer> _peer;
    std::string _method;
    std::string _path;
    std::string _body;
    std::size_t _received = 0;
    std::size_t _bodyMaximum = 0;           ///< when its head arrived
    std::function<void(Exchange&)> _serve;  ///< the function that head() returned
    std::optional<HttpAnswer> _headProblem;
    std::optional<HttpAnswer> _refusal;  ///< decided from the head, sent once the body has been read and dropped
    std::optional<HttpAnswer> _answer;
    std::shared_ptr<const std::string> _bytes;  ///< of the answer, while it is sent
    std::size_t _unread = 0;                    ///< bytes of it that count as unread; 0 when it has been dropped
    bool _suspended = false;
};

class HttpServer {
  public:
    /// Called with the whole request.
    using Serve = std::function<void(Exchange&)>;
    /// Called when the head of a request is there. Returns an answer to refuse it before its body is read, else the
    /// function to be called with the whole request. A request whose head has a problem is never served: the function
    /// should return that problem as the answer, or one that says less.
    using Head = std::function<std::variant<HttpAnswer, Serve>(Exchange&)>;

    /// Takes ownership of the listening socket. A client that exceeds the time for a request, or for reading on, is
    /// dropped. Throws std::runtime_error if the library fails to start.
    HttpServer(FileDescriptor listener, const RequestBounds& bounds, Head head);
    HttpServer(const HttpServer&) = delete;
    HttpServer& operator=(const HttpServer&) = delete;
    /// Every exchange must have its answer before.
    ~HttpServer();

    /// Adds the descriptors that become readable when run() has something to do. The listener is among them only while
    /// a connection can be accepted: otherwise it would stay readable and the loop would spin.
    void addTo(std::vector<pollfd>& entries) const;
    /// Milliseconds until run() must be called; nullopt if there is no limit.
    [[nodiscard]] std::optional<int> timeout() const;
    /// Accepts, reads, serves and sends everything that needs no waiting. Called after a poll of these entries. Returns
    /// true if it has read of a request's body, which may hold a secret.
    [[nodiscard]] bool run(std::span<const pollfd> polled);
    /// Changes the bound on bodies, for requests whose heads arrive from now on. The others are fixed at the start.
    void setBodyMaximum(std::size_t bytes) noexcept { _bounds.bodyBytes = bytes; }
    /// Closes the listening socket: accepts no further connection.
    void quiesce() noexcept { _listener.close(); }
    /// The number of requests that have begun and whose answers are not fully sent.
    [[nodiscard]] std::size_t open() const noexcept { return _open; }

  private:
    friend Exchange;
    using Clock = std::chrono::steady_clock;
    struct Client {
        int socket;
        std::shared_ptr<const Peer> peer;
        bool receiving;
        Clock::time_point since;
        std::optional<Clock::time_point> readBy = {};  ///< while an answer is sent: when it must have been read
    };
    struct Callbacks;

    int access(MHD_Connection* connection, const char* url, const char* method, const char* version, const char* data,
               std::size_t* size, Exchange** place);
    int begin(MHD_Connection* connection, const char* url, const char* method, const char* version, Exchange** place);
    int send(Exchange& exchange);
    static Client* clientOf(MHD_Connection* connection);
    [[nodiscard]] bool accepting() const noexcept;
    void accept();
    bool acceptOne();
    void refuse(int socket, uid_t uid);
    [[nodiscard]] bool libraryIsDue() const;
    void dropSlowClients(Clock::time_point now);
    void dropOldAnswers(const Exchange& newest);
    void forgetAnswer(Exchange& exchange) noexcept;
    void closed(const Client& client) noexcept;

    FileDescriptor _listener;
    RequestBounds _bounds;
    Head _head;
    MHD_Daemon* _daemon = nullptr;
    int _descriptor = -1;  ///< the library's: readable when it has something to do
    ConnectionLimits _limits;
    std::list<Client> _clients;
    Clock::time_point _slowClientsDue;              ///< when slow clients are looked for again
    std::optional<Clock::time_point> _acceptAfter;  ///< set while no descriptor is free
    std::optional<Clock::time_point> _refusalLogged;
    std::optional<Clock::time_point> _shortageLogged;
    std::size_t _open = 0;
    std::list<Exchange*> _sending;  ///< whose answers count as unread, the oldest first
    std::size_t _unread = 0;        ///< their bytes
    bool _returnMemory = false;     ///< large buffers have been freed
    bool _readBody = false;         ///< in this run
    bool _resumed = false;          ///< an answer has come that the library has to send
    std::string _idPrefix;
    unsigned long _idCount = 0;
};

}  // namespace adminhost
