#include "adminhostctl/Connection.h"

#include "adminhostctl/Interrupt.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <system_error>
#include <utility>

#include <curl/curl.h>
#include <fmt/format.h>
#include <netinet/in.h>
#include <sys/socket.h>

namespace adminhost::ctl {
namespace {

std::size_t append(char* bytes, std::size_t size, std::size_t count, void* place) noexcept {
    static_cast<std::string*>(place)->append(bytes, size * count);
    return size * count;
}

/// Called by the library at least once a second. The place is a RemoteHost, or null.
int stopWhenInterrupted(void* place, curl_off_t, curl_off_t, curl_off_t, curl_off_t) noexcept {
    if (place != nullptr) {
        static_cast<RemoteHost*>(place)->passMessages();
    }
    return isInterrupted() ? 1 : 0;
}

struct FreeList {
    void operator()(curl_slist* list) const noexcept { curl_slist_free_all(list); }
};
using HeaderList = std::unique_ptr<curl_slist, FreeList>;

constexpr int statusOfSsh = 255;  ///< the connection to the other machine was lost

struct FreeText {
    void operator()(char* text) const noexcept { curl_free(text); }
};

}  // namespace

/// Owns the transfer handle.
class Connection::Transfer {
  public:
    Transfer() : _curl(curl_easy_init()) {
        if (_curl == nullptr) {
            throw std::bad_alloc();
        }
    }
    ~Transfer() { curl_easy_cleanup(_curl); }
    Transfer(const Transfer&) = delete;
    Transfer& operator=(const Transfer&) = delete;

    [[nodiscard]] CURL* get() const noexcept { return _curl; }
    template <typename T>
    void set(CURLoption option, T value) const noexcept {
        curl_easy_setopt(_curl, option, value);
    }

  private:
    CURL* _curl;
};

/// The sockets of ssh that the library uses.
///
/// libcurl 7.88 (Debian 12) connects a socket again that its owner has declared connected, and fails. So it gets a new
/// socket and the address of a listener of ours, which accepts nothing: that one it connects. Directly before the
/// request is sent, the descriptor becomes that of ssh's socket. (The listener is not a Unix socket because the library
/// does not find a kept connection again whose address is not a text.)
class Connection::Sockets {
  public:
    explicit Sockets(RemoteHost& host) : _host(host) {}
    ~Sockets() {
        if (_next >= 0) {
            _host.close(_next);
        }
    }
    Sockets(const Sockets&) = delete;
    Sockets& operator=(const Sockets&) = delete;

    /// Returns false if the library must get another one.
    [[nodiscard]] bool isUsable() const noexcept { return _host.isConnected(_current); }
    /// The library's next connection uses this one.
    void provide(int socket) {
        _next = socket;
        sockaddr_in address{};
        address.sin_family = AF_INET;
        address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
        _addressSize = sizeof address;
        _listener = FileDescriptor(::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0));
        std::memcpy(&_address, &address, sizeof address);
        if (!_listener.isOpen() || ::bind(_listener.get(), &_address, sizeof address) != 0 ||
            ::listen(_listener.get(), 1) != 0 || ::getsockname(_listener.get(), &_address, &_addressSize) != 0) {
            throw std::system_error(errno, std::generic_category(), "socket");
        }
    }
    /// Whether a request has begun to be sent since begin().
    [[nodiscard]] bool hasSent() const noexcept { return _hasSent; }
    void begin() noexcept { _hasSent = false; }
    /// The one that the library got last; it may have closed it.
    [[nodiscard]] int current() const noexcept { return _current; }

    void setIn(const Transfer& transfer) {
        transfer.set(CURLOPT_OPENSOCKETFUNCTION, &open);
        transfer.set(CURLOPT_OPENSOCKETDATA, this);
        transfer.set(CURLOPT_PREREQFUNCTION, &replace);
        transfer.set(CURLOPT_PREREQDATA, this);
        transfer.set(CURLOPT_CLOSESOCKETFUNCTION, &close);
        transfer.set(CURLOPT_CLOSESOCKETDATA, this);
        transfer.set(CURLOPT_MAXCONNECTS, 1L);  // each is a process
    }

  private:
    static curl_socket_t open(void* place, curlsocktype, curl_sockaddr* address) noexcept {
        auto& self = *static_cast<Sockets*>(place);
        if (self._next < 0) {
            return CURL_SOCKET_BAD;
        }
        self._current = ::socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
        address->addr = self._address;
        address->addrlen = self._addressSize;
        return self._current < 0 ? CURL_SOCKET_BAD : self._current;
    }
    static int replace(void* place, char*, char*, int, int) noexcept {
        auto& self = *static_cast<Sockets*>(place);
        if (self._next >= 0) {  // the request does not use a kept connection
            if (!self._host.move(self._next, self._current)) {
                return CURL_PREREQFUNC_ABORT;
            }
            self._next = -1;
            self._listener.close();
        }
        self._hasSent = true;
        return CURL_PREREQFUNC_OK;
    }
    static int close(void* place, curl_socket_t socket) noexcept {
        static_cast<Sockets*>(place)->_host.close(socket);
        return 0;
    }

    RemoteHost& _host;
    FileDescriptor _listener;
    sockaddr _address{};
    socklen_t _addressSize = 0;
    int _next = -1;
    int _current = -1;
    bool _hasSent = false;
};

Connection::Connection(std::string socketPath)
    : _socketPath(std::move(socketPath)), _transfer(std::make_unique<Transfer>()) {}
Connection::Connection(std::unique_ptr<RemoteHost> host)
    : _host(std::move(host)), _sockets(std::make_unique<Sockets>(*_host)), _transfer(std::make_unique<Transfer>()) {}
Connection::~Connection() = default;
Connection::Connection(Connection&&) noexcept = default;

struct Connection::Exchange {
    const std::string& path;
    std::chrono::milliseconds timeout;
    const char* method = nullptr;  ///< null: GET, or POST with a body
    const std::string* body = nullptr;
    PostHeaders headers{};
};

DaemonReply Connection::get(const std::string& path, std::chrono::milliseconds timeout) {
    return send({path, timeout});
}
DaemonReply Connection::remove(const std::string& path, std::chrono::milliseconds timeout) {
    return send({path, timeout, "DELETE"});
}
DaemonReply Connection::post(const std::string& path, const std::string& body, std::chrono::milliseconds timeout,
                             const PostHeaders& headers) {
    return send({path, timeout, nullptr, &body, headers});
}

bool Connection::connectToHost(std::chrono::milliseconds& timeout) {
    _sockets->begin();
    if (_sockets->isUsable()) {
        return false;
    }
    const auto begin = std::chrono::steady_clock::now();
    const RemoteHost::Connected connected = _host->connect(timeout);
    _sockets->provide(connected.socket);
    _loginTime += connected.login;
    timeout -=
        std::chrono::floor<std::chrono::milliseconds>(std::chrono::steady_clock::now() - begin - connected.login);
    return true;
}

void Connection::fail(const Exchange& exchange, int result) const {
    if (_host && _sockets->hasSent() && result == CURLE_COULDNT_CONNECT) {
        result = CURLE_GOT_NOTHING;  // on a kept connection; another one would have been the second attempt
    }
    long number = 0;
    curl_easy_getinfo(_transfer->get(), CURLINFO_OS_ERRNO, &number);
    number = result == CURLE_COULDNT_CONNECT ? number : 0;
    const bool isLate = result == CURLE_OPERATION_TIMEDOUT;
    std::string why =
        number != 0 ? std::strerror(static_cast<int>(number)) : curl_easy_strerror(static_cast<CURLcode>(result));
    ExitStatus status = ExitStatus::notReachable;
    if (_host) {
        // One that is still connected is ended at once.
        const bool isConnected = isLate || isInterrupted();
        const std::optional<int> ssh = _host->statusOf(_sockets->current(), std::chrono::seconds(isConnected ? 0 : 2));
        if (ssh == statusOfSsh) {
            status = ExitStatus::hostNotReachable;
        }
        why = ssh.value_or(0) != 0 ? fmt::format("ssh ended with status {}", *ssh) : why;
    }
    const std::string late =
        fmt::format("the daemon has not answered within {:g} s",
                    std::chrono::duration<double>(std::max(exchange.timeout, std::chrono::milliseconds(1))).count());
    long sent = 0;
    curl_easy_getinfo(_transfer->get(), CURLINFO_REQUEST_SIZE, &sent);
    if (exchange.body != nullptr && (_host ? _sockets->hasSent() : sent > 0)) {
        throw LostConnection(ExitStatus::undetermined, isInterrupted() ? "interrupted"
                                                       : isLate        ? late
                                                                : "the connection to the daemon was lost: " + why);
    }
    if (isInterrupted()) {
        throw Failure(ExitStatus::failed, "interrupted; nothing was sent");
    }
    if (isLate) {
        throw Unavailable(ExitStatus::notReachable, late);
    }
    if (_host) {
        throw Unavailable(status, "the connection to the daemon of " + _host->host() + " was lost: " + why);
    }
    throwNotConnected(_socketPath, static_cast<int>(number), why);
}

DaemonReply Connection::send(const Exchange& exchange) {
    const std::string* const body = exchange.body;
    const PostHeaders& extra = exchange.headers;
    DaemonReply answer;
    // A number, so that no name is looked up.
    const std::string address = (_host ? "http://127.0.0.1" : "http://localhost") + exchange.path;
    // Without an empty Expect header, larger bodies would wait for a permission that the daemon need not give.
    HeaderList headers(curl_slist_append(nullptr, "Content-Type: application/json"));
    curl_slist_append(headers.get(), "Expect:");
    curl_slist_append(headers.get(), "Accept: application/json");
    for (const auto& [name, value] : {std::pair{"If-Match: ", &extra.revision},
                                      {"Request-Id: ", &extra.requestId},
                                      {"Request-Deadline: ", &extra.deadline}}) {
        if (!value->empty()) {
            curl_slist_append(headers.get(), (name + *value).c_str());
        }
    }

    // On a kept connection that turns out to be closed the library would send the request a second time. To another
    // machine it cannot: it gets no second socket.
    bool isFresh = !extra.requestId.empty();
    std::chrono::milliseconds timeout = exchange.timeout;
    curl_easy_reset(_transfer->get());
    if (_host) {
        isFresh = connectToHost(timeout);
        _sockets->setIn(*_transfer);
    } else {
        _transfer->set(CURLOPT_UNIX_SOCKET_PATH, _socketPath.c_str());
    }
    _transfer->set(CURLOPT_FRESH_CONNECT, isFresh ? 1L : 0L);
    _transfer->set(CURLOPT_URL, address.c_str());
    _transfer->set(CURLOPT_PROTOCOLS_STR, "http");
    _transfer->set(CURLOPT_NOPROXY, "*");
    _transfer->set(CURLOPT_NOSIGNAL, 1L);
    _transfer->set(CURLOPT_CONNECTTIMEOUT, 10L);
    _transfer->set(CURLOPT_TIMEOUT_MS, std::max(1L, static_cast<long>(timeout.count())));
    if (exchange.method != nullptr) {
        _transfer->set(CURLOPT_CUSTOMREQUEST, exchange.method);
    }
    _transfer->set(CURLOPT_HTTPHEADER, headers.get());
    _transfer->set(CURLOPT_WRITEFUNCTION, &append);
    _transfer->set(CURLOPT_WRITEDATA, &answer.body);
    if (body != nullptr || _host) {
        _transfer->set(CURLOPT_NOPROGRESS, 0L);
        _transfer->set(CURLOPT_XFERINFOFUNCTION, &stopWhenInterrupted);
        _transfer->set(CURLOPT_XFERINFODATA, _host.get());
    }
    if (body != nullptr) {
        _transfer->set(CURLOPT_POST, 1L);
        _transfer->set(CURLOPT_POSTFIELDS, body->data());
        _transfer->set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body->size()));
    }
    CURLcode result = curl_easy_perform(_transfer->get());
    if (_host && !isFresh && result == CURLE_COULDNT_CONNECT && (body == nullptr || !_sockets->hasSent())) {
        static_cast<void>(connectToHost(timeout));  // the kept connection has just ended
        _transfer->set(CURLOPT_FRESH_CONNECT, 1L);
        result = curl_easy_perform(_transfer->get());
    }
    if (result != CURLE_OK) {
        fail(exchange, result);
    }
    curl_easy_getinfo(_transfer->get(), CURLINFO_RESPONSE_CODE, &answer.status);
    curl_header* header = nullptr;
    if (curl_easy_header(_transfer->get(), "Request-Id", 0, CURLH_HEADER, -1, &header) == CURLHE_OK) {
        answer.requestId = header->value;
    }
    answer.notDone =
        curl_easy_header(_transfer->get(), "Adminhost-Not-Done", 0, CURLH_HEADER, -1, &header) == CURLHE_OK;
    if (curl_easy_header(_transfer->get(), "ETag", 0, CURLH_HEADER, -1, &header) == CURLHE_OK) {
        answer.revision = header->value;
    }
    if (curl_easy_header(_transfer->get(), "Retry-After", 0, CURLH_HEADER, -1, &header) == CURLHE_OK) {
        answer.retryAfter = std::max(0L, std::strtol(header->value, nullptr, 10));
    }
    return answer;
}

std::string Connection::escaped(const std::string& segment) {
    const std::unique_ptr<char, FreeText> text(
        curl_easy_escape(nullptr, segment.data(), static_cast<int>(segment.size())));
    return text ? std::string(text.get()) : std::string();
}

void throwNotConnected(const std::string& socketPath, int number, const std::string& why) {
    if (number == EACCES || number == EPERM) {
        throw Failure(ExitStatus::notPermitted,
                      "permission denied by the daemon's socket " + socketPath + "; its group and root may use it");
    }
    throw Unavailable(ExitStatus::notReachable, "the daemon cannot be reached at " + socketPath + ": " + why);
}

}  // namespace adminhost::ctl
