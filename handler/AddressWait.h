#pragma once

// The bounded wait for the grid controller's address.

#include <chrono>

namespace lumio {

/// Starts to resolve with a time-out of 10 seconds and runs the loop until there is an address or `failed` returns
/// true. Ten turns of at most one second each bound the wait, whatever the resolver's own time-out does. Service and
/// Loop are NetService and EventLoop, or stand-ins that count.
template <class Service, class Loop, class Failed>
void waitForAddress(Service& service, Loop& loop, Failed failed) {
    service.resolveWithTimeout(std::chrono::seconds(10));
    for (int turns = 10; !failed() && service.addresses().empty() && turns > 0; --turns) {
        loop.runOnce(std::chrono::seconds(1));
    }
}

}  // namespace lumio
