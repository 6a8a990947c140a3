#include "platform/log/QueuedSink.h"

#include <fmt/format.h>

namespace adminhost {

void QueuedSink::write(std::string_view event) noexcept {
    const std::lock_guard lock(_mutex);
    try {
        drain();
        add(event);
        drain();
    } catch (...) {
        lose(1);  // no memory left
    }
}

bool QueuedSink::flush() noexcept {
    const std::lock_guard lock(_mutex);
    try {
        return drain();
    } catch (...) {
        return false;
    }
}

void QueuedSink::lose(std::size_t events) noexcept {
    _lost += events;
    _lostInTotal += events;
}

std::size_t QueuedSink::lostInTotal() const noexcept {
    const std::lock_guard lock(_mutex);
    return _lostInTotal;
}

void QueuedSink::add(std::string_view event) {
    std::string text = logTextOf(event) + '\n';
    // A single event of any size is queued, because the output may accept it in parts.
    if (!_queue.empty() && _bytes + text.size() > maximum) {
        lose(1);
        return;
    }
    addNumberOfLost();
    _bytes += text.size();
    _queue.push_back({std::move(text)});
}

void QueuedSink::addNumberOfLost() {
    if (_lost > 0) {
        _queue.push_back(
            {fmt::format("adminhost: {} events were lost: the log could not be written\n", _lost), _lost, true});
        _bytes += _queue.back().text.size();
        _lost = 0;
    }
}

bool QueuedSink::drain() {
    while (!_queue.empty()) {
        Queued& first = _queue.front();
        const Written written = _write(first.text);
        if (written.outcome == Outcome::later) {
            first.text.erase(0, written.bytes);
            _bytes -= written.bytes;
            return false;
        }
        const bool failed = written.outcome == Outcome::failed;
        if (failed) {
            // The number of lost events was counted when they were lost.
            _lost += first.events;
            _lostInTotal += first.isNumberOfLost ? 0 : first.events;
        }
        _bytes -= first.text.size();
        _queue.pop_front();
        if (_queue.empty() && !failed) {
            addNumberOfLost();
        }
    }
    return true;
}

}  // namespace adminhost
