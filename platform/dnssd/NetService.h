#pragma once

// Resolution of a DNS-SD service instance to the addresses of its host.
//
//     EventLoop loop;
//     NetService service(loop, "local", "_nimbo._tcp", "Studio One");
//     service.setDelegate({...});
//     service.resolveWithTimeout(std::chrono::seconds(10));
//     while (service.addresses().empty() && ...) { loop.runOnce(std::chrono::seconds(1)); }
//
// The Avahi daemon resolves it over the system bus (DBUS_SYSTEM_BUS_ADDRESS is honoured). For a name that no host has,
// the daemon reports a failure after 5 seconds. If the bus or the daemon does not reply, the time-out ends the
// resolution.

#include "platform/dnssd/EventLoop.h"
#include "platform/framework/Export.h"
#include "platform/value/Value.h"

#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace adminhost {

/// The bytes of a socket address (sockaddr_in or sockaddr_in6, whole).
using SocketAddress = std::vector<std::uint8_t>;

class ADMINHOST_EXPORT NetService {
  public:
    /// Callbacks; an empty one is not called. They may stop the service, but not destroy it.
    struct Delegate {
        /// The resolution failed and is over. The dictionary holds "errorCode" (an integer, below 0, as Avahi numbers
        /// them) and "errorDescription".
        std::function<void(NetService&, const Dictionary&)> didNotResolve;
        /// The resolution was stopped, or its time-out came after an address was found.
        std::function<void(NetService&)> didStop;
    };

    /// Code of a time-out, ours or the daemon's.
    static constexpr int timeoutCode = -15;
    /// Code if there is no bus or no daemon.
    static constexpr int noDaemonCode = -26;

    NetService(EventLoop& loop, std::string domain, std::string type, std::string name);
    NetService(const NetService&) = delete;
    NetService& operator=(const NetService&) = delete;
    ~NetService();  ///< ends the resolution without a callback

    void setDelegate(Delegate delegate) { _delegate = std::move(delegate); }

    /// Begins to resolve and returns at once. If there is no bus, or a text is not UTF-8, didNotResolve is called
    /// before it returns; every other callback comes while the loop runs. A resolution that is already under way is
    /// restarted.
    void resolveWithTimeout(std::chrono::milliseconds timeout);
    /// Ends the resolution; didStop is called if one was under way. The addresses found so far stay.
    void stop();

    [[nodiscard]] const std::string& domain() const noexcept { return _domain; }
    [[nodiscard]] const std::string& type() const noexcept { return _type; }
    [[nodiscard]] const std::string& name() const noexcept { return _name; }
    /// The addresses found so far, each once, in the order of their arrival.
    [[nodiscard]] const std::vector<SocketAddress>& addresses() const noexcept { return _addresses; }

  private:
    friend class EventLoop;
    struct Resolution;
    /// Does everything that is due. Returns true if any of it was news.
    bool advance();
    [[nodiscard]] std::optional<std::chrono::steady_clock::time_point> deadline() const;
    void begin();
    void end();

    EventLoop& _loop;
    std::string _domain;
    std::string _type;
    std::string _name;
    Delegate _delegate;
    std::vector<SocketAddress> _addresses;
    std::unique_ptr<Resolution> _resolution;  ///< while under way
};

}  // namespace adminhost
