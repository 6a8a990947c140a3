#include "platform/dnssd/EventLoop.h"

#include "platform/dnssd/NetService.h"
#include "platform/dnssd/Poll.h"

#include <algorithm>
#include <new>

namespace adminhost {

using Clock = std::chrono::steady_clock;

EventLoop::EventLoop() : _poll(std::make_unique<Poll>()) {
    _poll->handle.reset(::avahi_simple_poll_new());
    if (!_poll->handle) {
        throw std::bad_alloc();
    }
}

EventLoop::~EventLoop() = default;

bool EventLoop::runOnce(std::chrono::milliseconds time) {
    const Clock::time_point end = Clock::now() + time;
    bool polling = true;
    while (polling) {
        Clock::time_point until = end;
        for (const NetService* service : _services) {
            until = std::min(until, service->deadline().value_or(end));
        }
        const auto wait = std::chrono::ceil<std::chrono::milliseconds>(until - Clock::now()).count();
        polling = ::avahi_simple_poll_iterate(_poll->handle.get(), static_cast<int>(std::max<long>(wait, 0))) == 0;
        // Callbacks may stop services and begin others: walk over a copy, past those that are gone.
        const std::vector<NetService*> services = _services;
        bool news = false;
        for (NetService* service : services) {
            if (std::find(_services.begin(), _services.end(), service) != _services.end()) {
                news = service->advance() || news;
            }
        }
        if (news) {
            return true;
        }
        polling = polling && Clock::now() < end;
    }
    return false;
}

}  // namespace adminhost
