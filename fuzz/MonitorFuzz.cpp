// A packet of a broken front: only a message of the one size and a known kind is accepted.

#include "adminhostd/MonitorMessage.h"

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include <sys/socket.h>

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
    using namespace adminhost;
    static const auto ends = monitorSocketPair();
    if (::send(ends[0].get(), data, size, MSG_DONTWAIT | MSG_NOSIGNAL) < 0) {
        return 0;
    }
    const ReceivedMessage received = receiveMonitorMessage(ends[1].get());
    const bool accepted = received.kind == ReceivedMessage::Kind::message;
    if (!accepted && received.kind != ReceivedMessage::Kind::malformed) {
        std::abort();
    }
    if (accepted && (size != sizeof received.message || std::memcmp(&received.message, data, size) != 0 ||
                     received.message.kind < MonitorMessage::Kind::start ||
                     received.message.kind > MonitorMessage::Kind::configuration)) {
        std::abort();
    }
    return 0;
}
