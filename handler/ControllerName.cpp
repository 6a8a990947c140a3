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

adminhost::Result<std::string> LumioRequestHandler::hostNameOfController(const std::string& name) {
    adminhost::EventLoop loop;
    NetService service(loop, "local", "_nimbo._tcp", name);
    service.setDelegate({[this](NetService& from, const Dictionary& error) { netService(from, error); },
                         [this](NetService& from) { netServiceDidStop(from); }});
    mBJError.reset();
    waitForAddress(service, loop, [this] { return mBJError.has_value(); });
    adminhost::Result<std::string> host = adminhost::failure({"adminhost_lumio", 0, "no answer within ten seconds"});
    if (!service.addresses().empty()) {
        adminhost::HostName found = adminhost::hostNameOf(service.addresses().front());
        if (found.error != 0) {
            const std::string words = "unable to resolve host: error = " + std::to_string(found.error);
            adminhost::logEvent("adminhost_lumio: " + words);
            host = adminhost::failure({"adminhost_lumio", found.error, words});
        } else if (found.name) {
            host = *std::move(found.name);
        } else {
            host = adminhost::failure({"adminhost_lumio", 0, "the host's address has no name"});
        }
    } else if (mBJError) {
        host = adminhost::failure({"adminhost_lumio", mBJError->get("errorCode").integer().value_or(std::int64_t{0}),
                                   textOf(mBJError->get("errorDescription"))});
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
