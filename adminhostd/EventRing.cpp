#include "adminhostd/EventRing.h"

#include "platform/framework/PluginRequestHandler.h"

#include <chrono>
#include <utility>

namespace adminhost {
namespace {

constexpr std::string_view settings = "settings";

bool isEnd(unsigned status) noexcept {
    return status != 0;
}

}  // namespace

std::string EventRing::newEpoch() {
    return makeUUIDString();
}

void EventRing::add(const RequestRecord& record) {
    Event event;
    event.when = std::chrono::floor<std::chrono::seconds>(std::chrono::system_clock::now());
    event.plugin = record.plugin;
    event.command = record.command;
    event.uid = record.peer.uid;
    event.request = record.id;
    event.checkOnly = record.checkOnly;
    event.milliseconds = record.milliseconds;
    for (auto& [section, keys] : record.changedKeys(keysMaximum)) {
        Event change = event;
        change.kind = section == settings ? "settingsChanged" : "resourcesChanged";
        change.section = section;
        change.keys = std::move(keys);
        add(std::move(change));
    }
    event.kind = "requestEnded";
    event.status = record.status;
    event.error = record.error;
    add(std::move(event));
}

void EventRing::add(Event event) {
    event.number = ++_last;
    _events.push_back(std::move(event));
    if (_events.size() > length) {
        _events.pop_front();
    }
}

bool EventRing::isCurrent(std::uint64_t after, std::string_view epoch) const noexcept {
    return after == _last && (epoch.empty() || epoch == _epoch);
}

Dictionary EventRing::since(std::optional<std::uint64_t> after, std::string_view epoch, uid_t uid, bool all) const {
    const std::uint64_t known = after.value_or(_last);
    // Numbers of an earlier daemon say nothing about these events.
    const bool other = known > _last || (!epoch.empty() && epoch != _epoch);
    const bool missed = other || (!_events.empty() && known + 1 < _events.front().number);
    Array events;
    for (const Event& event : _events) {
        if (after && (other || event.number > known)) {
            events.emplace_back(event.describe(all || event.uid == uid));
        }
    }
    return {{"epoch", _epoch}, {"last", _last}, {"missed", missed}, {"events", std::move(events)}};
}

Dictionary EventRing::Event::describe(bool details) const {
    Dictionary text{{"number", number}, {"kind", kind}, {"when", when}, {"plugin", plugin}, {"command", command}};
    text.set("checkOnly", checkOnly ? Value(true) : Value());
    if (isEnd(status)) {
        text.set("status", status);
        text.set("error", error.empty() ? Value() : Value(error));
    } else {
        text.set("section", section);
        text.set("keys", Array(keys.begin(), keys.end()));
    }
    if (details) {
        text.set("request", request);
        text.set("uid", uid);
        text.set("milliseconds", isEnd(status) ? Value(milliseconds) : Value());
    }
    return text;
}

}  // namespace adminhost
