#include "adminhostd/DirectoryProbe.h"

#include "adminhostd/Protocol.h"

#include <utility>

namespace adminhost {
namespace {

/// The process needs five seconds at most to try the nodes (WorkerDirectory.h).
constexpr auto bound = std::chrono::seconds(8);

}  // namespace

void DirectoryProbe::start(MonitorLink& monitor) {
    if (_process) {
        return;
    }
    _process = WorkerProcess::start(monitor, WorkerProcess::Purpose::tryDirectory);
    _until = std::chrono::steady_clock::now() + bound;
}

void DirectoryProbe::addTo(std::vector<pollfd>& entries) const {
    if (_process) {
        _process->addTo(entries);
    }
}

std::optional<std::chrono::steady_clock::time_point> DirectoryProbe::due() const {
    return _process ? std::optional(_until) : std::nullopt;
}

void DirectoryProbe::run(std::span<const pollfd> polled, const std::function<void(const std::string&)>& log) {
    if (!_process) {
        return;
    }
    // Checked first: then everything that the process sent before its end is still read below.
    const bool ended = _process->ending().has_value();
    bool more = false;
    if (ended || _process->mayConverse(polled)) {
        more = _process->converse();
        while (auto frame = _process->next()) {
            const auto message = protocol::toFront(std::move(*frame));
            if (const auto* event = message ? std::get_if<protocol::Log>(&*message) : nullptr) {
                log(event->event);
            }
        }
    }
    if (ended && !more) {
        _process.reset();
    } else if (std::chrono::steady_clock::now() >= _until) {
        log("adminhostd: whether the directory's nodes can be reached could not be found out in time");
        _process.reset();
    }
}

}  // namespace adminhost
