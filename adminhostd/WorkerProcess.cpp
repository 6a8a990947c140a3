#include "adminhostd/WorkerProcess.h"

#include "adminhostd/Polled.h"
#include "adminhostd/WorkerStart.h"

#include <cerrno>
#include <cstring>
#include <utility>

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/socket.h>

namespace adminhost {

std::unique_ptr<WorkerProcess> WorkerProcess::start(MonitorLink& monitor, Purpose purpose) {
    std::unique_ptr<WorkerProcess> worker(new WorkerProcess(monitor));
    worker->_number = monitor.start(purpose == Purpose::tryDirectory,
                                    [self = worker.get()](ReceivedMessage& received) { self->receive(received); });
    return worker->_number == 0 ? nullptr : std::move(worker);
}

void WorkerProcess::receive(ReceivedMessage& received) {
    const MonitorMessage& message = received.message;
    if (message.kind == MonitorMessage::Kind::ended) {
        _ending = endingText(message.status);
    } else if (message.kind == MonitorMessage::Kind::start && message.status == EBUSY) {
        _waitsFor = message.process;
    } else if (message.kind == MonitorMessage::Kind::start && message.status != 0) {
        _ending = fmt::format("cannot be started: {}", std::strerror(message.status));
    } else if (message.kind == MonitorMessage::Kind::start && !_pid) {
        _waitsFor.reset();
        _pid = message.process;
        _socket = std::move(received.descriptors[0]);
        _process = std::move(received.descriptors[1]);
        ::fcntl(_socket.get(), F_SETFL, O_NONBLOCK);
        write();
    }
}

WorkerProcess::~WorkerProcess() {
    if (_number != 0) {
        kill();
        _monitor.forget(_number);
    }
}

void WorkerProcess::addTo(std::vector<pollfd>& entries) const {
    entries.push_back(
        {_closed ? -1 : _socket.get(), static_cast<short>(_unsent.empty() ? POLLIN : POLLIN | POLLOUT), 0});
    entries.push_back({_monitor.closed() && !_ending ? _process.get() : -1, POLLIN, 0});
}

bool WorkerProcess::mayConverse(std::span<const pollfd> polled) const noexcept {
    return !_closed && _socket.isOpen() && isReady(polled, _socket.get());
}

bool WorkerProcess::send(const Frame& frame) {
    auto bytes = encodeFrame(frame);
    if (!bytes) {
        return false;
    }
    *bytes += frame.bytes;
    if (_unsent.empty()) {
        _unsent = std::move(*bytes);
    } else {
        _unsent += *bytes;
    }
    write();
    return true;
}

void WorkerProcess::write() {
    while (_socket.isOpen() && _sent < _unsent.size()) {
        const ssize_t written = ::send(_socket.get(), _unsent.data() + _sent, _unsent.size() - _sent, MSG_NOSIGNAL);
        if (written < 0 && errno == EINTR) {
            continue;
        }
        if (written < 0) {
            // Full, or closed: the end of the process is noticed separately.
            break;
        }
        _sent += static_cast<std::size_t>(written);
    }
    if (_sent == _unsent.size()) {
        std::string().swap(_unsent);
        _sent = 0;
    }
}

bool WorkerProcess::converse() {
    if (!_unsent.empty()) {
        write();
    }
    if (!_socket.isOpen() || _closed) {
        return false;
    }
    const auto [count, filled] = _reader.readFrom(_socket.get());
    if (count > 0) {
        return filled;
    }
    if (count < 0 && errno == EINTR) {
        return true;
    }
    _closed = count == 0 || errno != EAGAIN;
    return false;
}

const std::optional<std::string>& WorkerProcess::ending() {
    // The monitor reports how a worker ended. Without a monitor only the end itself can be seen.
    if (!_ending && _monitor.closed()) {
        pollfd entry{_process.get(), POLLIN, 0};
        if (!_process.isOpen() || ::poll(&entry, 1, 0) > 0) {
            _ending = "ended, and the system does not know how";
        }
    }
    return _ending;
}

void WorkerProcess::kill() noexcept {
    if (!_ending) {
        _monitor.kill(_number);
    }
}

}  // namespace adminhost
