#include "adminhostd/Http.h"

#include "adminhostd/RequestBody.h"
#include "platform/framework/PluginRequestHandler.h"
#include "platform/json/Json.h"
#include "platform/plist/PropertyList.h"

#include <algorithm>
#include <cctype>
#include <charconv>
#include <stdexcept>

#include <fmt/format.h>
#include <microhttpd.h>
#include <poll.h>
#include <strings.h>
#include <sys/socket.h>

namespace adminhost {
namespace {

constexpr unsigned connectionMaximum = 256;
constexpr std::size_t headMaximum = std::size_t{32}
                                    << 10U;  ///< bytes of a request's head and what the library keeps with it
/// A body of unknown length that has outgrown the bound is read away up to here, so that the client gets its answer.
constexpr std::size_t discardMaximum = 4 * bodyMaximum;

std::string_view headerOf(MHD_Connection* connection, const char* name) {
    const char* value = ::MHD_lookup_connection_value(connection, MHD_HEADER_KIND, name);
    return value == nullptr ? std::string_view() : std::string_view(value);
}

std::uint64_t announcedLength(MHD_Connection* connection) {
    const std::string_view text = headerOf(connection, MHD_HTTP_HEADER_CONTENT_LENGTH);
    std::uint64_t length = 0;
    const auto parsed = std::from_chars(text.data(), text.data() + text.size(), length);
    return parsed.ec == std::errc::result_out_of_range ? UINT64_MAX : length;
}

/// The path of a request's target, which may be a whole address.
std::string pathOf(std::string_view target) {
    constexpr std::string_view scheme = "http://";
    if (target.starts_with(scheme)) {
        target.remove_prefix(std::min(target.find('/', scheme.size()), target.size()));
    }
    return target.empty() ? "/" : std::string(target);
}

HttpAnswer malformed(const char* message) {
    return {400, Dictionary{{"error", "MALFORMED_HEAD"}, {"message", message}}, {}};
}

/// What is wrong with the head of a request that the library lets pass.
std::optional<HttpAnswer> headRefusal(MHD_Connection* connection, std::string_view version) {
    if (version == MHD_HTTP_VERSION_1_1 && headerOf(connection, MHD_HTTP_HEADER_HOST).data() == nullptr) {
        return malformed("A request has a Host header, whatever it says.");
    }
    const std::string_view coding = headerOf(connection, MHD_HTTP_HEADER_TRANSFER_ENCODING);
    if (!coding.empty() && (coding.size() != 7 || ::strncasecmp(coding.data(), "chunked", 7) != 0)) {
        return malformed("The only Transfer-Encoding is chunked.");
    }
    return std::nullopt;
}

/// Decodes %XX in place. A zero byte would end the text for whoever reads it, so that another address were served than
/// was asked for: it stays as it was sent, as does what is no code.
std::size_t decodeEscapes(void*, MHD_Connection*, char* text) {
    char* to = text;
    for (const char* from = text; *from != '\0'; ++to) {
        unsigned code = 0;
        if (*from == '%' && std::isxdigit(static_cast<unsigned char>(from[1])) != 0 &&
            std::from_chars(from + 1, from + 3, code, 16).ptr == from + 3 && code != 0) {
            *to = static_cast<char>(code);
            from += 3;
        } else {
            *to = *from++;
        }
    }
    *to = '\0';
    return static_cast<std::size_t>(to - text);
}

HttpAnswer bodyTooLarge() {
    return {413,
            Dictionary{{"error", "BODY_TOO_LARGE"},
                       {"message", fmt::format("The request's body may have {} bytes at most.", bodyMaximum)}},
            {}};
}

}  // namespace

std::string_view Exchange::header(const char* name) const {
    return headerOf(_connection, name);
}

std::string_view Exchange::argument(const char* name) const {
    const char* value = ::MHD_lookup_connection_value(_connection, MHD_GET_ARGUMENT_KIND, name);
    return value == nullptr ? std::string_view() : std::string_view(value);
}

bool Exchange::clientGone() const noexcept {
    // The library gives up a client that has closed only its sending half, too.
    pollfd entry{_socket, POLLRDHUP, 0};
    return ::poll(&entry, 1, 0) == 1 && (entry.revents & (POLLRDHUP | POLLHUP | POLLERR)) != 0;
}

void Exchange::answer(HttpAnswer answer) {
    _answer = std::move(answer);
    if (_suspended) {
        _suspended = false;
        ::MHD_resume_connection(_connection);
    }
}

/// What the library calls: no exception may reach it.
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
        if (*place != nullptr) {
            delete static_cast<Exchange*>(*place);
            *place = nullptr;
            --static_cast<HttpServer*>(context)->_open;
        }
        if (Client* client = clientOf(connection)) {
            client->receiving = true;
            client->since = std::chrono::steady_clock::now();
        }
    }

    static void connection(void* context, MHD_Connection* connection, void** place,
                           MHD_ConnectionNotificationCode code) {
        auto& server = *static_cast<HttpServer*>(context);
        if (code == MHD_CONNECTION_NOTIFY_STARTED) {
            Client client{-1, {}, true, std::chrono::steady_clock::now()};
            if (const auto* info = ::MHD_get_connection_info(connection, MHD_CONNECTION_INFO_CONNECTION_FD)) {
                client.socket = info->connect_fd;
            }
            ucred credentials{};
            socklen_t size = sizeof credentials;
            if (::getsockopt(client.socket, SOL_SOCKET, SO_PEERCRED, &credentials, &size) == 0) {
                client.peer = {credentials.uid, credentials.gid, credentials.pid};
            }
            try {
                *place = &server._clients.emplace_back(client);
            } catch (...) {
                *place = nullptr;
            }
        } else if (*place != nullptr) {
            const auto* gone = static_cast<Client*>(*place);
            server._clients.remove_if([&](const Client& client) { return &client == gone; });
            *place = nullptr;
        }
    }
};

HttpServer::HttpServer(FileDescriptor listener, std::chrono::seconds clientTimeout, Head head, Serve serve)
    : _listener(std::move(listener)),
      _clientTimeout(clientTimeout),
      _head(std::move(head)),
      _serve(std::move(serve)),
      // Different after each start, so that an id from a log names one request only.
      _idPrefix(makeUUIDString().substr(0, 8)) {
    _daemon =
        ::MHD_start_daemon(MHD_USE_EPOLL | MHD_ALLOW_SUSPEND_RESUME, 0, nullptr, nullptr, &Callbacks::access, this,  //
                           MHD_OPTION_LISTEN_SOCKET, _listener.get(),                                                //
                           MHD_OPTION_CONNECTION_LIMIT, connectionMaximum,                                           //
                           MHD_OPTION_CONNECTION_MEMORY_LIMIT, headMaximum,                                          //
                           MHD_OPTION_CONNECTION_TIMEOUT, static_cast<unsigned>(_clientTimeout.count()),             //
                           MHD_OPTION_NOTIFY_COMPLETED, &Callbacks::completed, this,                                 //
                           MHD_OPTION_NOTIFY_CONNECTION, &Callbacks::connection, this,                               //
                           MHD_OPTION_UNESCAPE_CALLBACK, &decodeEscapes, nullptr,                                    //
                           MHD_OPTION_SIGPIPE_HANDLED_BY_APP, 1,                                                     //
                           MHD_OPTION_END);
    if (_daemon == nullptr) {
        throw std::runtime_error("the HTTP library does not start");
    }
    _descriptor = ::MHD_get_daemon_info(_daemon, MHD_DAEMON_INFO_EPOLL_FD)->epoll_fd;
}

HttpServer::~HttpServer() {
    quiesce();
    ::MHD_stop_daemon(_daemon);
}

std::optional<int> HttpServer::timeout() const {
    MHD_UNSIGNED_LONG_LONG milliseconds = 0;
    std::optional<int> timeout;
    if (::MHD_get_timeout(_daemon, &milliseconds) == MHD_YES) {
        timeout = static_cast<int>(std::min<MHD_UNSIGNED_LONG_LONG>(milliseconds, 60'000));
    }
    // Slow clients are looked for once a second.
    return _clients.empty() ? timeout : std::min(timeout.value_or(1000), 1000);
}

void HttpServer::run() {
    dropSlowClients();
    ::MHD_run(_daemon);
}

void HttpServer::quiesce() {
    if (_listener.isOpen() && ::MHD_quiesce_daemon(_daemon) != MHD_INVALID_SOCKET) {
        _listener.close();
    }
}

HttpServer::Client* HttpServer::clientOf(MHD_Connection* connection) {
    const auto* info = ::MHD_get_connection_info(connection, MHD_CONNECTION_INFO_SOCKET_CONTEXT);
    return info == nullptr ? nullptr : static_cast<Client*>(info->socket_context);
}

void HttpServer::dropSlowClients() {
    // The library's own bound is on silence; one byte every few seconds would hold a connection for ever.
    const auto now = std::chrono::steady_clock::now();
    for (Client& client : _clients) {
        if (client.receiving && now - client.since > _clientTimeout) {
            ::shutdown(client.socket, SHUT_RDWR);
            client.receiving = false;
        }
    }
}

int HttpServer::begin(MHD_Connection* connection, const char* url, const char* method, const char* version,
                      Exchange** place) {
    auto exchange = std::unique_ptr<Exchange>(new Exchange);
    exchange->_connection = connection;
    exchange->_id = fmt::format("{}-{}", _idPrefix, ++_idCount);
    exchange->_method = method;
    exchange->_path = pathOf(url);
    if (const Client* client = clientOf(connection)) {
        exchange->_peer = client->peer;
        exchange->_socket = client->socket;
    }
    *place = exchange.release();
    ++_open;
    Exchange& begun = **place;
    begun._refusal = _head(begun);
    if (auto refusal = begun._refusal ? std::nullopt : headRefusal(connection, version)) {
        begun._answer = std::move(refusal);
        return send(begun);
    }
    const bool tooLarge = announcedLength(connection) > bodyMaximum;
    if (!begun._refusal && tooLarge) {
        begun._refusal = bodyTooLarge();
    }
    const bool waits = !headerOf(connection, MHD_HTTP_HEADER_EXPECT).empty();
    if (begun._refusal && (tooLarge || waits || begun._refusal->status == 403)) {
        begun._answer = std::move(begun._refusal);  // at once, without taking the body
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
        if (exchange._received > bodyMaximum) {
            exchange.dropBody();
            exchange._refusal = bodyTooLarge();
        } else if (!exchange._refusal) {
            exchange._body.append(data, *size);
        }
        *size = 0;
        return exchange._received > discardMaximum ? MHD_NO : MHD_YES;
    }
    if (!exchange._answer) {
        if (Client* client = clientOf(connection)) {
            client->receiving = false;
        }
        if (exchange._refusal) {
            exchange._answer = std::move(exchange._refusal);
        } else {
            _serve(exchange);
        }
    }
    if (!exchange._answer) {
        exchange._suspended = true;
        ::MHD_suspend_connection(connection);
        return MHD_YES;
    }
    return send(exchange);
}

int HttpServer::send(Exchange& exchange) {
    const HttpAnswer& answer = *exchange._answer;
    const char* type = nullptr;
    if (answer.body) {
        std::optional<std::string> text;
        // A value that a property list cannot carry is sent as JSON all the same: the type says what it is.
        if (prefersPropertyList(exchange.header(MHD_HTTP_HEADER_ACCEPT))) {
            text = xmlPropertyList(*answer.body);
            type = "application/x-plist";
        }
        if (!text) {
            text = jsonOf(*answer.body);
            *text += '\n';
            type = "application/json";
        }
        exchange._bytes = std::move(*text);
    }
    MHD_Response* response =
        ::MHD_create_response_from_buffer(exchange._bytes.size(), exchange._bytes.data(), MHD_RESPMEM_PERSISTENT);
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
