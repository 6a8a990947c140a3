#include "adminhostctl/Connection.h"

#include "adminhostctl/Interrupt.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <memory>
#include <utility>

#include <curl/curl.h>
#include <fmt/format.h>

namespace adminhost::ctl {
namespace {

std::size_t append(char* bytes, std::size_t size, std::size_t count, void* place) noexcept {
    static_cast<std::string*>(place)->append(bytes, size * count);
    return size * count;
}

/// Called by the library at least once a second.
int stopWhenInterrupted(void*, curl_off_t, curl_off_t, curl_off_t, curl_off_t) noexcept {
    return isInterrupted() ? 1 : 0;
}

struct FreeList {
    void operator()(curl_slist* list) const noexcept { curl_slist_free_all(list); }
};
using HeaderList = std::unique_ptr<curl_slist, FreeList>;

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

Connection::Connection(std::string socketPath)
    : _socketPath(std::move(socketPath)), _transfer(std::make_unique<Transfer>()) {}
Connection::~Connection() = default;
Connection::Connection(Connection&&) noexcept = default;
Connection& Connection::operator=(Connection&&) noexcept = default;

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

DaemonReply Connection::send(const Exchange& exchange) {
    const std::string* const body = exchange.body;
    const PostHeaders& extra = exchange.headers;
    DaemonReply answer;
    const std::string address = "http://localhost" + exchange.path;
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

    curl_easy_reset(_transfer->get());
    _transfer->set(CURLOPT_UNIX_SOCKET_PATH, _socketPath.c_str());
    _transfer->set(CURLOPT_URL, address.c_str());
    _transfer->set(CURLOPT_PROTOCOLS_STR, "http");
    _transfer->set(CURLOPT_NOPROXY, "*");
    _transfer->set(CURLOPT_NOSIGNAL, 1L);
    _transfer->set(CURLOPT_CONNECTTIMEOUT, 10L);
    _transfer->set(CURLOPT_TIMEOUT_MS, std::max(1L, static_cast<long>(exchange.timeout.count())));
    if (exchange.method != nullptr) {
        _transfer->set(CURLOPT_CUSTOMREQUEST, exchange.method);
    }
    _transfer->set(CURLOPT_HTTPHEADER, headers.get());
    _transfer->set(CURLOPT_WRITEFUNCTION, &append);
    _transfer->set(CURLOPT_WRITEDATA, &answer.body);
    if (!extra.requestId.empty()) {
        // On a kept connection that turns out to be closed the library would send the request a second time.
        _transfer->set(CURLOPT_FRESH_CONNECT, 1L);
    }
    if (body != nullptr) {
        _transfer->set(CURLOPT_POST, 1L);
        _transfer->set(CURLOPT_NOPROGRESS, 0L);
        _transfer->set(CURLOPT_XFERINFOFUNCTION, &stopWhenInterrupted);
        _transfer->set(CURLOPT_POSTFIELDS, body->data());
        _transfer->set(CURLOPT_POSTFIELDSIZE_LARGE, static_cast<curl_off_t>(body->size()));
    }
    const CURLcode result = curl_easy_perform(_transfer->get());
    if (result != CURLE_OK) {
        long number = 0;
        curl_easy_getinfo(_transfer->get(), CURLINFO_OS_ERRNO, &number);
        if (result == CURLE_COULDNT_CONNECT && (number == EACCES || number == EPERM)) {
            throw Failure(ExitStatus::notPermitted, "permission denied by the daemon's socket " + _socketPath +
                                                        "; its group and root may use it");
        }
        const bool isLate = result == CURLE_OPERATION_TIMEDOUT;
        const std::string why = result == CURLE_COULDNT_CONNECT && number != 0 ? std::strerror(static_cast<int>(number))
                                                                               : curl_easy_strerror(result);
        const std::string late = fmt::format(
            "the daemon has not answered within {:g} s",
            std::chrono::duration<double>(std::max(exchange.timeout, std::chrono::milliseconds(1))).count());
        long sent = 0;
        curl_easy_getinfo(_transfer->get(), CURLINFO_REQUEST_SIZE, &sent);
        if (body != nullptr && sent > 0) {
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
        throw Unavailable(ExitStatus::notReachable, "the daemon cannot be reached at " + _socketPath + ": " + why);
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

}  // namespace adminhost::ctl
