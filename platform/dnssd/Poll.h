#pragma once

// Inside the room: the loop's poll object.

#include "platform/dnssd/EventLoop.h"

#include <avahi-common/simple-watch.h>

namespace adminhost {

struct EventLoop::Poll {
    struct Free {
        void operator()(AvahiSimplePoll* poll) const noexcept { ::avahi_simple_poll_free(poll); }
    };
    std::unique_ptr<AvahiSimplePoll, Free> handle;
};

}  // namespace adminhost
