// Resolution of the grid controller's DNS-SD name to a host name.

#include "handler/AddressWait.h"
#include "handler/LumioRequestHandler.h"
#include "platform/dnssd/EventLoop.h"
#include "platform/dnssd/HostName.h"
#include "platform/dnssd/NetService.h"
#include "platform/log/Log.h"
#include "platform/value/ValueText.h"

namespace lumio {

using adminhost::Dictionary;
using adminhost::NetService;

std::optional<std::string> LumioRequestHandler::hostNameOfController(const std::string& name) {
    adminhost::EventLoop loop;
    NetService service(loop, "local", "_nimbo._tcp", name);
    service.setDelegate({[this](NetService& from, const Dictionary& error) { netService(from, error); },
                         [this](NetService& from) { netServiceDidStop(from); }});
    mBJError.reset();
    waitForAddress(service, loop, [this] { return mBJError.has_value(); });
    std::optional<std::string> host;
    if (!service.addresses().empty()) {
        adminhost::HostName found = adminhost::hostNameOf(service.addresses().front());
        if (found.error != 0) {
            adminhost::logEvent("adminhost_lumio: unable to resolve host: error = " + std::to_string(found.error));
        }
        host = std::move(found.name);
    }
    service.stop();
    return host;
}

void LumioRequestHandler::netService(const NetService& service, const Dictionary& didNotResolve) {
    adminhost::logEvent("adminhost_lumio: unable to resolve " + service.name() +
                        ", error: " + textOf(adminhost::Value(didNotResolve)));
    mBJError = didNotResolve;
}

void LumioRequestHandler::netServiceDidStop(const NetService&) {
    mBJError.reset();
}

}  // namespace lumio
