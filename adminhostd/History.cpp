#include "adminhostd/History.h"

#include <algorithm>

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr std::size_t logMaximum = std::size_t{64} << 10U;  ///< bytes of one request's events

}  // namespace

void RequestRecord::addLog(std::string_view event) {
    if (_logBytes + event.size() > logMaximum) {
        ++_dropped;
        return;
    }
    _logBytes += event.size();
    log.emplace_back(event);
}

Dictionary RequestRecord::describe() const {
    constexpr const char* names[] = {"waiting", "running", "done"};
    Dictionary text{{"request", id},       {"state", names[static_cast<int>(state)]},
                    {"plugin", plugin},    {"command", command},
                    {"uid", peer.uid},     {"pid", peer.pid},
                    {"received", received}};
    if (state == State::running) {
        text.set("since", since);
    }
    if (state == State::done) {
        text.set("milliseconds", milliseconds);
        text.set("status", status);
        text.set("error", error.empty() ? Value() : Value(error));
    }
    Array lines(log.begin(), log.end());
    text.set("log", std::move(lines));
    text.set("logLinesDropped", _dropped == 0 ? Value() : Value(_dropped));
    return text;
}

std::shared_ptr<RequestRecord> History::begin(const Exchange& exchange) {
    auto record = std::make_shared<RequestRecord>();
    record->id = exchange.id();
    record->peer = exchange.peer();
    record->received = std::chrono::floor<std::chrono::seconds>(std::chrono::system_clock::now());
    record->arrival = std::chrono::steady_clock::now();
    return record;
}

std::shared_ptr<RequestRecord> History::add(const Exchange& exchange) {
    auto record = begin(exchange);
    _records.push_back(record);
    if (_records.size() > length) {
        _records.pop_front();
    }
    return record;
}

const RequestRecord* History::find(std::string_view id) const {
    const auto found =
        std::find_if(_records.begin(), _records.end(), [&](const auto& record) { return record->id == id; });
    return found == _records.end() ? nullptr : found->get();
}

}  // namespace adminhost
