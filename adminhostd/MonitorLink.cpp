#include "adminhostd/MonitorLink.h"

#include "adminhostd/Polled.h"

#include <cerrno>
#include <utility>

namespace adminhost {

std::uint32_t MonitorLink::start(bool triesNodes, Receiver receiver) {
    if (closed()) {
        errno = EPIPE;
        return 0;
    }
    const std::uint32_t number = ++_last;
    if (!sendMonitorMessage(_socket.get(), {MonitorMessage::Kind::start, number, 0, triesNodes ? 1 : 0})) {
        return 0;
    }
    _receivers.emplace(number, std::move(receiver));
    return number;
}

void MonitorLink::kill(std::uint32_t worker) noexcept {
    // One that cannot be sent is not lost: the monitor also kills a worker that overruns its deadline.
    static_cast<void>(sendMonitorMessage(_socket.get(), {MonitorMessage::Kind::kill, worker, 0, 0}));
}

void MonitorLink::run(std::span<const pollfd> polled) {
    if (!isReady(polled, _socket.get())) {
        return;
    }
    while (!closed()) {
        ReceivedMessage received = receiveMonitorMessage(_socket.get());
        if (received.kind == ReceivedMessage::Kind::none) {
            return;
        }
        if (received.kind != ReceivedMessage::Kind::message) {
            _socket.close();
            return;
        }
        if (received.message.kind == MonitorMessage::Kind::configuration) {
            const bool isNewForWorkers =
                received.message.status == 1 || (_configuration && _configuration->isNewForWorkers);
            _configuration = Configuration{std::move(received.descriptors.front()), isNewForWorkers};
            continue;
        }
        const auto found = _receivers.find(received.message.worker);
        if (found != _receivers.end()) {
            found->second(received);
        }
    }
}

}  // namespace adminhost
