#include "adminhostd/Http.h"

#include "adminhostd/HttpHead.h"
#include "adminhostd/Polled.h"
#include "adminhostd/RequestBody.h"
#include "platform/framework/PluginRequestHandler.h"
#include "platform/json/Json.h"
#include "platform/log/Log.h"
#include "platform/plist/PropertyList.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <stdexcept>

#include <fmt/format.h>
#include <malloc.h>
#include <microhttpd.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

namespace adminhost {
namespace {

using namespace std::chrono_literals;

constexpr int acceptedAtOnce = 64;  ///< connections in one turn, so that a flood of them does not hold up the others
constexpr auto slowClientsPause = 100ms;                    ///< between two looks for slow clients
constexpr auto shortagePause = 1s;                          ///< until the next try when no descriptor is free
constexpr auto logPause = 60s;                              ///< between two events about the same kind of refusal
constexpr std::size_t answerPiece = std::size_t{1} << 20U;  ///< bytes that a client has the time-out to read
/// Answers above this size do not fit a socket's buffer of ordinary size.
constexpr std::size_t ordinaryBuffer = std::size_t{64} << 10U;
/// For them. The system doubles it, and a client that does not read has it in the kernel's memory.
constexpr int roomForAnswers = 256 << 10U;
/// Freed buffers of at least this size are worth returning to the system.
constexpr std::size_t largeBuffer = std::size_t{1} << 20U;
/// What the library keeps of a request beside its head. A head that exceeds the bound by no more than this is answered
/// like any other error, a longer one by the library itself.
constexpr std::size_t headReserve = std::size_t{16} << 10U;
/// A body of unknown length that exceeds the bound is read and dropped up to so many times this size, so that the
/// client gets its answer.
constexpr std::size_t discardFactor = 4;

// The library takes a connection over at once, and reports it, only if it knows that no other thread calls it. Before
// this version it needs no flag for that.
#if MHD_VERSION >= 0x00097501
constexpr unsigned oneThread = MHD_USE_NO_THREAD_SAFETY;
#else
constexpr unsigned oneThread = 0;
#endif

std::size_t descriptorMaximum() noexcept {
    rlimit bound{};
    return ::getrlimit(RLIMIT_NOFILE, &bound) == 0 ? bound.rlim_cur : 0;
}

/// Returns true if no event of this kind has been logged lately: clients must not be able to fill the log.
bool worthLogging(std::optional<std::chrono::steady_clock::time_point>& last) {
    const auto now = std::chrono::steady_clock::now();
    if (last && now - *last < logPause) {
        return false;
    }
    last = now;
    return true;
}

HttpAnswer bodyTooLarge(std::size_t maximum) {
    return {413,
            Dictionary{{"error", "BODY_TOO_LARGE"},
                       {"message", fmt::format("The request's body may have {} bytes at most.", maximum)}},
            {}};
}

}  // namespace

std::optional<std::string_view> Exchange::header(const char* name) const {
    return headerOf(_connection, name);
}

bool Exchange::wantsPropertyList() const {
    return prefersPropertyList(header(MHD_HTTP_HEADER_ACCEPT).value_or(""));
}

std::string_view Exchange::argument(const char* name) const {
    const char* value = ::MHD_lookup_connection_value(_connection, MHD_GET_ARGUMENT_KIND, name);
    return value == nullptr ? std::string_view() : std::string_view(value);
}

bool Exchange::hasArgument(std::string_view name) const {
    const char* value = nullptr;
    std::size_t size = 0;
    return ::MHD_lookup_connection_value_n(_connection, MHD_GET_ARGUMENT_KIND, name.data(), name.size(), &value,
                                           &size) == MHD_YES;
}

bool Exchange::clientGone() const noexcept {
    // The library gives up a client that has closed only its sending half, too.
    pollfd entry{_socket, POLLRDHUP, 0};
    return ::poll(&entry, 1, 0) == 1 && (entry.revents & (POLLRDHUP | POLLHUP | POLLERR)) != 0;
}

void Exchange::dropBody() noexcept {
    ::explicit_bzero(_body.data(), _body.size());
    std::string().swap(_body);
}

void Exchange::answer(HttpAnswer answer) {
    _answer = std::move(answer);
    if (_suspended) {
        _suspended = false;
        _server._resumed = true;
        ::MHD_resume_connection(_connection);
    }
}

/// The library's callbacks: no exception may leave them.
struct HttpServer::Callbacks {
    static MHD_Result access(void* context, MHD_Connection* connection, const char* url, const char* method,
                             const char* version, const char* data, std::size_t* size, void** place) {
        try {
            return static_cast<MHD_Result>(static_cast<HttpServer*>(context)->access(
                connection, url, method, version, data, size, reinterpret_cast<Exchange**>(place)));
        } catch (...) {
            return MHD_NO;  // closes the connection
        }
    }

    static void completed(void* context, MHD_Connection* connection, void** place, MHD_RequestTerminationCode) {
        auto& server = *static_cast<HttpServer*>(context);
        if (auto* const exchange = static_cast<Exchange*>(*place)) {
            server._returnMemory |=
                (exchange->_bytes && exchange->_bytes->size() >= largeBuffer) || exchange->_received >= largeBuffer;
            server.forgetAnswer(*exchange);
            delete exchange;
            *place = nullptr;
            --server._open;
        }
        if (Client* client = clientOf(connection)) {
            client->receiving = true;
            client->since = Clock::now();
            client->readBy.reset();
        }
    }

    static void connection(void* context, MHD_Connection*, void** place, MHD_ConnectionNotificationCode code) {
        auto& server = *static_cast<HttpServer*>(context);
        if (code == MHD_CONNECTION_NOTIFY_STARTED) {
            *place = &server._clients.back();  // which accept() has just added
        } else if (*place != nullptr) {
            server.closed(*static_cast<Client*>(*place));
            *place = nullptr;
        }
    }
};

HttpServer::HttpServer(FileDescriptor listener, const RequestBounds& bounds, Head head)
    : _listener(std::move(listener)),
      _bounds(bounds),
      _head(std::move(head)),
      _limits(descriptorMaximum(), bounds.connections),
      // Different after each start, so that an id from a log names one request only.
      _idPrefix(makeUUIDString().substr(0, 8)) {
    // The library does not accept by itself: it would stop for good after it has run out of connections or descriptors,
    // and it does not know which account a connection comes from.
    _daemon = ::MHD_start_daemon(MHD_USE_EPOLL | MHD_USE_NO_LISTEN_SOCKET | MHD_ALLOW_SUSPEND_RESUME | oneThread, 0,
                                 nullptr, nullptr, &Callbacks::access, this,                                          //
                                 MHD_OPTION_CONNECTION_LIMIT, static_cast<unsigned>(_limits.total()),                 //
                                 MHD_OPTION_CONNECTION_MEMORY_LIMIT, bounds.headBytes + headReserve,                  //
                                 MHD_OPTION_CONNECTION_TIMEOUT, static_cast<unsigned>(bounds.clientTimeout.count()),  //
                                 MHD_OPTION_NOTIFY_COMPLETED, &Callbacks::completed, this,                            //
                                 MHD_OPTION_NOTIFY_CONNECTION, &Callbacks::connection, this,                          //
                                 MHD_OPTION_UNESCAPE_CALLBACK, &decodeEscapes, nullptr,                               //
                                 MHD_OPTION_SIGPIPE_HANDLED_BY_APP, 1,                                                //
                                 MHD_OPTION_END);
    if (_daemon == nullptr) {
        throw std::runtime_error(
            fmt::format("the HTTP library fails to start: {}; the daemon needs at least {} file descriptors (ulimit "
                        "-n, LimitNOFILE)",
                        std::strerror(errno), 2 * ConnectionLimits::ownDescriptors));
    }
    _descriptor = ::MHD_get_daemon_info(_daemon, MHD_DAEMON_INFO_EPOLL_FD)->epoll_fd;
}

HttpServer::~HttpServer() {
    ::MHD_stop_daemon(_daemon);
}

bool HttpServer::accepting() const noexcept {
    return _listener.isOpen() && !_limits.full() && !_acceptAfter;
}

void HttpServer::addTo(std::vector<pollfd>& entries) const {
    entries.push_back({_descriptor, POLLIN, 0});
    entries.push_back({accepting() ? _listener.get() : -1, POLLIN, 0});
}

std::optional<int> HttpServer::timeout() const {
    if (_resumed) {
        return 0;
    }
    MHD_UNSIGNED_LONG_LONG milliseconds = 0;
    std::optional<int> timeout;
    if (::MHD_get_timeout(_daemon, &milliseconds) == MHD_YES) {
        timeout = static_cast<int>(std::min<MHD_UNSIGNED_LONG_LONG>(milliseconds, 60'000));
    }
    // Slow clients, and a descriptor that has become free, are looked for once a second.
    return _clients.empty() && !_acceptAfter ? timeout : std::min(timeout.value_or(1000), 1000);
}

bool HttpServer::libraryIsDue() const {
    MHD_UNSIGNED_LONG_LONG milliseconds = 0;
    return ::MHD_get_timeout(_daemon, &milliseconds) == MHD_YES && milliseconds == 0;
}

bool HttpServer::run(std::span<const pollfd> polled) {
    _readBody = false;
    const auto now = Clock::now();
    if (now >= _slowClientsDue) {
        dropSlowClients(now);
        _slowClientsDue = now + slowClientsPause;
    }
    if (_acceptAfter && now >= *_acceptAfter) {
        _acceptAfter.reset();
    }
    // Each of these asks the system once more, which costs as much as serving a small request.
    if (std::exchange(_resumed, false) || isReady(polled, _descriptor) || libraryIsDue()) {
        ::MHD_run(_daemon);
    }
    if (isReady(polled, _listener.get())) {
        accept();
    }
    if (_returnMemory) {
        // The allocator keeps freed memory below anything that is still in use: after large answers, most of it.
        ::malloc_trim(0);
        _returnMemory = false;
    }
    return _readBody;
}

void HttpServer::accept() {
    for (int i = 0; i < acceptedAtOnce && accepting() && acceptOne(); ++i) {
    }
}

bool HttpServer::acceptOne() {
    FileDescriptor socket(::accept4(_listener.get(), nullptr, nullptr, SOCK_CLOEXEC | SOCK_NONBLOCK));
    if (!socket.isOpen()) {
        if (errno == EMFILE || errno == ENFILE || errno == ENOBUFS || errno == ENOMEM) {
            const int failure = errno;
            _acceptAfter = Clock::now() + shortagePause;
            if (worthLogging(_shortageLogged)) {
                logEvent(
                    fmt::format("adminhostd: cannot accept connections: {}; {} are open; raise the number of file "
                                "descriptors (LimitNOFILE)",
                                std::strerror(failure), _clients.size()));
            }
        }
        return errno == EINTR || errno == ECONNABORTED;
    }
    ucred credentials{};
    socklen_t size = sizeof credentials;
    if (::getsockopt(socket.get(), SOL_SOCKET, SO_PEERCRED, &credentials, &size) != 0) {
        return true;  // requests without an account are never served: closes the connection
    }
    if (!_limits.add(credentials.uid)) {
        // Connections that the client has just closed must not count: only the library can notice that.
        ::MHD_run(_daemon);
        if (!_limits.add(credentials.uid)) {
            refuse(socket.get(), credentials.uid);
            return true;
        }
    }
    try {
        _clients.push_back(
            {socket.get(), std::make_shared<const Peer>(peerOf(socket.get(), credentials)), true, Clock::now()});
    } catch (...) {
        _limits.remove(credentials.uid);
        throw;
    }
    const std::size_t held = _clients.size();
    sockaddr address{};
    address.sa_family = AF_UNIX;
    // From here on the socket is the library's, also when it fails.
    if (::MHD_add_connection(_daemon, socket.release(), &address, sizeof address.sa_family) != MHD_YES) {
        if (_clients.size() == held) {  // else the library has reported the end of the connection already
            closed(_clients.back());
        }
        _acceptAfter = Clock::now() + shortagePause;
        return false;
    }
    return true;
}

/// The answer is sent without waiting for the request: it is there when the client reads.
void HttpServer::refuse(int socket, uid_t uid) {
    if (worthLogging(_refusalLogged)) {
        logEvent(fmt::format("adminhostd: uid {} has too many connections open; further ones are refused", uid));
    }
    const std::string body = jsonOf(Dictionary{{"error", "TOO_MANY_CONNECTIONS"},
                                               {"message",
                                                "This account has too many connections open; close some, "
                                                "or try again later."}}) +
                             "\n";
    const std::string text = fmt::format(
        "HTTP/1.1 503 Service Unavailable\r\nConnection: close\r\nRetry-After: 1\r\nContent-Type: "
        "application/json\r\nContent-Length: {}\r\n\r\n{}",
        body.size(), body);
    static_cast<void>(::send(socket, text.data(), text.size(), MSG_DONTWAIT | MSG_NOSIGNAL));
}

void HttpServer::closed(const Client& client) noexcept {
    _limits.remove(client.peer->uid);
    _clients.remove_if([&](const Client& other) { return &other == &client; });
    _acceptAfter.reset();  // its descriptor is about to be free
}

HttpServer::Client* HttpServer::clientOf(MHD_Connection* connection) {
    const auto* info = ::MHD_get_connection_info(connection, MHD_CONNECTION_INFO_SOCKET_CONTEXT);
    return info == nullptr ? nullptr : static_cast<Client*>(info->socket_context);
}

void HttpServer::dropSlowClients(Clock::time_point now) {
    // The library only bounds silence; a client that sends one byte every few seconds would hold a connection for ever.
    for (Client& client : _clients) {
        if ((client.receiving && now - client.since > _bounds.clientTimeout) ||
            (client.readBy && now > *client.readBy)) {
            ::shutdown(client.socket, SHUT_RDWR);
            client.receiving = false;
            client.readBy.reset();
        }
    }
}

int HttpServer::begin(MHD_Connection* connection, const char* url, const char* method, const char* version,
                      Exchange** place) {
    auto exchange = std::unique_ptr<Exchange>(new Exchange(*this));
    exchange->_connection = connection;
    exchange->_id = fmt::format("{}-{}", _idPrefix, ++_idCount);
    exchange->_method = method;
    exchange->_path = pathOf(url);
    const Client* client = clientOf(connection);
    exchange->_peer = client != nullptr ? client->peer : std::make_shared<const Peer>();
    exchange->_socket = client != nullptr ? client->socket : -1;
    *place = exchange.release();
    ++_open;
    Exchange& begun = **place;
    begun._bodyMaximum = _bounds.bodyBytes;
    begun._headProblem = headRefusal(connection, version, _bounds.headBytes);
    auto decided = _head(begun);
    if (auto* refusal = std::get_if<HttpAnswer>(&decided)) {
        begun._refusal = std::move(*refusal);
    } else {
        begun._serve = std::move(std::get<Serve>(decided));
    }
    if (begun._headProblem) {
        begun._answer = std::move(begun._refusal ? begun._refusal : begun._headProblem);
        return send(begun);
    }
    const bool tooLarge = announcedLength(connection) > begun._bodyMaximum;
    if (!begun._refusal && tooLarge) {
        begun._refusal = bodyTooLarge(begun._bodyMaximum);
    }
    const bool waits = headerOf(connection, MHD_HTTP_HEADER_EXPECT).has_value();
    if (begun._refusal && (tooLarge || waits || begun._refusal->status == 403)) {
        begun._answer = std::move(begun._refusal);  // at once, without reading the body
        return send(begun);
    }
    return MHD_YES;
}

int HttpServer::access(MHD_Connection* connection, const char* url, const char* method, const char* version,
                       const char* data, std::size_t* size, Exchange** place) {
    if (*place == nullptr) {
        return begin(connection, url, method, version, place);
    }
    Exchange& exchange = **place;
    if (*size > 0) {
        exchange._received += *size;
        _readBody = true;
        if (exchange._received > exchange._bodyMaximum) {
            exchange.dropBody();
            exchange._refusal = bodyTooLarge(exchange._bodyMaximum);
        } else if (!exchange._refusal) {
            exchange._body.append(data, *size);
        }
        // It may hold a password, and the library reuses its buffer without clearing it. The buffer is not constant:
        // the library only promises that it does not look at these bytes again.
        ::explicit_bzero(const_cast<char*>(data), *size);
        *size = 0;
        return exchange._received / discardFactor > exchange._bodyMaximum ? MHD_NO : MHD_YES;
    }
    if (!exchange._answer) {
        if (Client* client = clientOf(connection)) {
            client->receiving = false;
        }
        if (exchange._refusal) {
            exchange._answer = std::move(exchange._refusal);
        } else {
            exchange._serve(exchange);
        }
    }
    if (!exchange._answer) {
        exchange._suspended = true;
        ::MHD_suspend_connection(connection);
        return MHD_YES;
    }
    return send(exchange);
}

void HttpServer::forgetAnswer(Exchange& exchange) noexcept {
    if (exchange._unread > 0) {
        _unread -= exchange._unread;
        exchange._unread = 0;
        _sending.remove(&exchange);
    }
}

void HttpServer::dropOldAnswers(const Exchange& newest) {
    while (_unread > unreadMaximum && _sending.front() != &newest) {
        Exchange& oldest = *_sending.front();
        logEvent(
            fmt::format("adminhostd: the answer to request {} is dropped after {} of {} bytes of unread answers: "
                        "its client did not read it",
                        oldest._id, _unread, unreadMaximum));
        ::shutdown(oldest._socket, SHUT_RDWR);
        forgetAnswer(oldest);
    }
}

int HttpServer::send(Exchange& exchange) {
    HttpAnswer& answer = *exchange._answer;
    const char* type = nullptr;
    std::size_t clients = 1;
    if (answer.text) {
        clients = answer.text->clients;
        exchange._bytes = std::move(answer.text->bytes);
        type = answer.text->type;
        answer.text.reset();
    } else if (answer.body) {
        std::optional<std::string> text;
        // A value that a property list cannot carry is sent as JSON instead; the Content-Type states the form.
        if (exchange.wantsPropertyList()) {
            if (auto list = xmlPropertyList(*answer.body)) {
                text = *std::move(list);
            }
            type = "application/x-plist";
        }
        if (!text) {
            text = jsonOf(*answer.body);
            *text += '\n';
            type = "application/json";
        }
        answer.body.reset();  // one form in memory is enough, for as long as the client takes to read it
        text->shrink_to_fit();
        exchange._bytes = std::make_shared<const std::string>(*std::move(text));
    }
    const std::string_view bytes = exchange._bytes ? std::string_view(*exchange._bytes) : std::string_view();
    if (!bytes.empty()) {
        _sending.push_back(&exchange);
        exchange._unread = std::max<std::size_t>(bytes.size() / clients, 1);
        _unread += exchange._unread;
        _returnMemory |= exchange._unread >= largeBuffer;
        dropOldAnswers(exchange);
    }
    if (bytes.size() > ordinaryBuffer) {
        // The fewer pieces it is sent in, the less often client and front wake each other.
        ::setsockopt(exchange._socket, SOL_SOCKET, SO_SNDBUF, &roomForAnswers, sizeof roomForAnswers);
    }
    if (Client* client = clientOf(exchange._connection)) {
        // A client that reads a byte a second would hold the answer's memory for ever.
        const auto pieces = static_cast<int>(1 + bytes.size() / answerPiece);
        client->readBy = Clock::now() + pieces * _bounds.clientTimeout;
        client->receiving = false;
    }
    // The library does not write to a persistent buffer.
    MHD_Response* response =
        ::MHD_create_response_from_buffer(bytes.size(), const_cast<char*>(bytes.data()), MHD_RESPMEM_PERSISTENT);
    if (response == nullptr) {
        return MHD_NO;
    }
    if (type != nullptr) {
        ::MHD_add_response_header(response, MHD_HTTP_HEADER_CONTENT_TYPE, type);
    }
    ::MHD_add_response_header(response, "Request-Id", exchange._id.c_str());
    ::MHD_add_response_header(response, MHD_HTTP_HEADER_CACHE_CONTROL, "no-store");
    for (const auto& [name, value] : answer.headers) {
        ::MHD_add_response_header(response, name.c_str(), value.c_str());
    }
    const int queued = ::MHD_queue_response(exchange._connection, answer.status, response);
    ::MHD_destroy_response(response);
    return queued;
}

}  // namespace adminhost
