#include "platform/dnssd/NetService.h"

#include "platform/dnssd/Poll.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <cstring>
#include <string_view>

#include <avahi-client/client.h>
#include <avahi-client/lookup.h>
#include <avahi-common/error.h>
#include <netinet/in.h>
#include <systemd/sd-bus.h>

namespace adminhost {
namespace {

using Clock = std::chrono::steady_clock;

static_assert(NetService::timeoutCode == AVAHI_ERR_TIMEOUT && NetService::noDaemonCode == AVAHI_ERR_NO_DAEMON);

struct Free {
    void operator()(sd_bus* bus) const noexcept { ::sd_bus_close_unref(bus); }
    void operator()(AvahiClient* client) const noexcept { ::avahi_client_free(client); }
    void operator()(AvahiServiceResolver* resolver) const noexcept { ::avahi_service_resolver_free(resolver); }
};

Dictionary failure(int code, std::string_view description) {
    return {{"errorCode", code}, {"errorDescription", utf8Of(description)}};
}

Dictionary failure(int code) {
    return failure(code, ::avahi_strerror(code));
}

template <class Address>
SocketAddress bytesOf(const Address& address) {
    SocketAddress bytes(sizeof address);
    std::memcpy(bytes.data(), &address, sizeof address);
    return bytes;
}

SocketAddress socketAddress(const AvahiAddress& address, std::uint16_t port, AvahiIfIndex interface) {
    if (address.proto == AVAHI_PROTO_INET) {
        sockaddr_in four{};
        four.sin_family = AF_INET;
        four.sin_port = htons(port);
        four.sin_addr.s_addr = address.data.ipv4.address;
        return bytesOf(four);
    }
    sockaddr_in6 six{};
    six.sin6_family = AF_INET6;
    six.sin6_port = htons(port);
    std::memcpy(&six.sin6_addr, address.data.ipv6.address, sizeof six.sin6_addr);
    if (IN6_IS_ADDR_LINKLOCAL(&six.sin6_addr)) {
        six.sin6_scope_id = static_cast<std::uint32_t>(interface);
    }
    return bytesOf(six);
}

/// Finds out whether the daemon replies, without blocking. Avahi's client library makes its first calls to the daemon
/// synchronously and waits 25 seconds for each, so it must only be used once the daemon is known to reply.
class DaemonProbe {
  public:
    enum class State { asking, answered, failed };

    explicit DaemonProbe(const AvahiPoll* poll) : _poll(poll) {
        sd_bus* bus = nullptr;
        int status = ::sd_bus_open_system(&bus);
        _bus.reset(bus);
        if (status >= 0) {
            status = ::sd_bus_call_method_async(bus, nullptr, "org.freedesktop.Avahi", "/",
                                                "org.freedesktop.Avahi.Server", "GetState", onReply, this, "");
        }
        if (status < 0) {
            fail(std::string("no system bus: ") + std::strerror(-status));
            return;
        }
        _watch = poll->watch_new(poll, ::sd_bus_get_fd(bus), AVAHI_WATCH_IN, onEvent, this);
        process();
    }
    DaemonProbe(const DaemonProbe&) = delete;
    DaemonProbe& operator=(const DaemonProbe&) = delete;
    ~DaemonProbe() {
        if (_watch != nullptr) {
            _poll->watch_free(_watch);
        }
    }

    [[nodiscard]] State state() const noexcept { return _state; }
    [[nodiscard]] const std::string& reason() const noexcept { return _reason; }

  private:
    void fail(std::string reason) {
        _state = State::failed;
        _reason = std::move(reason);
    }

    void process() {
        int status = 0;
        do {
            status = ::sd_bus_process(_bus.get(), nullptr);
        } while (status > 0 && _state == State::asking);
        if (_state != State::asking) {
            _poll->watch_update(_watch, AvahiWatchEvent{});
        } else if (status < 0) {
            fail(std::string("the system bus failed: ") + std::strerror(-status));
            _poll->watch_update(_watch, AvahiWatchEvent{});
        } else {
            _poll->watch_update(_watch, static_cast<AvahiWatchEvent>(std::max(::sd_bus_get_events(_bus.get()), 0)));
        }
    }

    static void onEvent(AvahiWatch*, int, AvahiWatchEvent, void* self) { static_cast<DaemonProbe*>(self)->process(); }

    static int onReply(sd_bus_message* reply, void* self, sd_bus_error*) {
        const sd_bus_error* error = ::sd_bus_message_get_error(reply);
        if (error == nullptr) {
            static_cast<DaemonProbe*>(self)->_state = State::answered;
        } else {
            static_cast<DaemonProbe*>(self)->fail(std::string("the Avahi daemon does not answer: ") +
                                                  (error->message == nullptr ? error->name : error->message));
        }
        return 1;
    }

    const AvahiPoll* _poll;
    std::unique_ptr<sd_bus, Free> _bus;
    AvahiWatch* _watch = nullptr;
    State _state = State::asking;
    std::string _reason;
};

}  // namespace

/// Avahi's callbacks only store their news here; NetService::advance acts on it, outside of Avahi's own calls.
struct NetService::Resolution {
    Clock::time_point deadline;
    std::optional<DaemonProbe> probe;
    std::unique_ptr<AvahiClient, Free> client;
    std::unique_ptr<AvahiServiceResolver, Free> resolver;  // freed before its client
    std::optional<int> failed;
    std::vector<SocketAddress> found;

    static void onClient(AvahiClient* client, AvahiClientState state, void* self) {
        if (state == AVAHI_CLIENT_FAILURE) {
            static_cast<Resolution*>(self)->failed = ::avahi_client_errno(client);
        }
    }

    static void onResolver(AvahiServiceResolver* resolver, AvahiIfIndex interface, AvahiProtocol,
                           AvahiResolverEvent event, const char*, const char*, const char*, const char*,
                           const AvahiAddress* address, std::uint16_t port, AvahiStringList*, AvahiLookupResultFlags,
                           void* self) {
        auto& resolution = *static_cast<Resolution*>(self);
        if (event == AVAHI_RESOLVER_FOUND && address != nullptr) {
            resolution.found.push_back(socketAddress(*address, port, interface));
        } else if (event == AVAHI_RESOLVER_FAILURE) {
            resolution.failed = ::avahi_client_errno(::avahi_service_resolver_get_client(resolver));
        }
    }
};

NetService::NetService(EventLoop& loop, std::string domain, std::string type, std::string name)
    : _loop(loop), _domain(std::move(domain)), _type(std::move(type)), _name(std::move(name)) {}

NetService::~NetService() {
    end();
}

std::optional<Clock::time_point> NetService::deadline() const {
    return _resolution ? std::optional(_resolution->deadline) : std::nullopt;
}

void NetService::end() {
    _resolution.reset();
    std::erase(_loop._services, this);
}

void NetService::resolveWithTimeout(std::chrono::milliseconds timeout) {
    end();
    _addresses.clear();
    _resolution = std::make_unique<Resolution>();
    _resolution->deadline = Clock::now() + timeout;
    _loop._services.push_back(this);
    const auto carried = [](const std::string& text) { return isUtf8(text) && text.find('\0') == std::string::npos; };
    if (!carried(_name) || !carried(_type) || !carried(_domain)) {
        _resolution->failed = AVAHI_ERR_INVALID_SERVICE_NAME;  // the bus library aborts on such a text
        advance();
        return;
    }
    _resolution->probe.emplace(::avahi_simple_poll_get(_loop._poll->handle.get()));
    if (_resolution->probe->state() == DaemonProbe::State::failed) {
        advance();
    }
}

void NetService::stop() {
    if (!_resolution) {
        return;
    }
    end();
    if (_delegate.didStop) {
        _delegate.didStop(*this);
    }
}

/// Called once the daemon is known to reply.
void NetService::begin() {
    Resolution& resolution = *_resolution;
    resolution.probe.reset();
    int error = 0;
    resolution.client.reset(::avahi_client_new(::avahi_simple_poll_get(_loop._poll->handle.get()), AvahiClientFlags{},
                                               Resolution::onClient, &resolution, &error));
    if (!resolution.client) {
        resolution.failed = error;
        return;
    }
    resolution.resolver.reset(::avahi_service_resolver_new(
        resolution.client.get(), AVAHI_IF_UNSPEC, AVAHI_PROTO_UNSPEC, _name.c_str(), _type.c_str(), _domain.c_str(),
        AVAHI_PROTO_UNSPEC, AvahiLookupFlags{}, Resolution::onResolver, &resolution));
    if (!resolution.resolver) {
        resolution.failed = ::avahi_client_errno(resolution.client.get());
    }
}

bool NetService::advance() {
    if (!_resolution) {
        return false;
    }
    std::optional<Dictionary> error;
    if (_resolution->probe) {
        const DaemonProbe& probe = *_resolution->probe;
        if (probe.state() == DaemonProbe::State::answered) {
            begin();
        } else if (probe.state() == DaemonProbe::State::failed) {
            error = failure(noDaemonCode, probe.reason());
        }
    }
    bool news = false;
    for (SocketAddress& address : _resolution->found) {
        if (std::find(_addresses.begin(), _addresses.end(), address) == _addresses.end()) {
            _addresses.push_back(std::move(address));
            news = true;
        }
    }
    _resolution->found.clear();
    if (_resolution->failed) {
        error = failure(*_resolution->failed);
    }
    const bool late = Clock::now() >= _resolution->deadline;
    if (!error && !late) {
        return news;
    }
    if (!_addresses.empty()) {
        stop();  // the addresses found so far stay
        return true;
    }
    end();
    if (_delegate.didNotResolve) {
        _delegate.didNotResolve(*this, error.value_or(failure(timeoutCode)));
    }
    return true;
}

}  // namespace adminhost
