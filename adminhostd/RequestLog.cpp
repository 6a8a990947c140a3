#include "adminhostd/RequestLog.h"

#include "adminhostd/ReportForm.h"
#include "platform/value/ValueCodec.h"

#include <algorithm>
#include <set>
#include <utility>

namespace adminhost {
namespace {

char lowerCase(char c) noexcept {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

bool sameId(std::string_view a, std::string_view b) noexcept {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(),
                      [](char x, char y) { return lowerCase(x) == lowerCase(y); });
}

Value countOrNull(std::size_t count) {
    return count == 0 ? Value() : Value(count);
}

}  // namespace

void RequestRecord::add(std::string_view event) {
    if (_logBytes + event.size() > logMaximum) {
        ++_logDropped;
        return;
    }
    _logBytes += event.size();
    _log.emplace_back(event);
}

void RequestRecord::add(const Change& change) {
    keep(_changes, reportOf(change));
}

void RequestRecord::add(const NotDone& part) {
    keep(_notDone, reportOf(part));
}

void RequestRecord::hide(const SecretPart& part) {
    for (Value& value : _changes.kept) {
        Dictionary& change = *value.dictionary();
        if (!part.identity.empty() && change.get("section") == Value(part.section) &&
            change.get("identity") == Value(part.identity) && change.get("key") == Value(part.key)) {
            for (const char* key : {"from", "to", "undo"}) {
                change.set(key, Value());
            }
            change.set("secret", true);
        }
    }
}

void RequestRecord::keep(Reports& reports, Dictionary report) {
    ++reports.reported;
    std::string bytes;
    if (reports.kept.size() < reportsMaximum) {
        encodeValue(report, bytes);
    }
    if (reports.kept.size() == reportsMaximum || _reportBytes + bytes.size() > reportBytesMaximum) {
        return;
    }
    _reportBytes += bytes.size();
    reports.kept.emplace_back(std::move(report));
}

void RequestRecord::close(unsigned answered, std::string_view code) {
    const std::chrono::duration<double, std::milli> duration = std::chrono::steady_clock::now() - arrival;
    milliseconds = duration.count();
    state = State::done;
    status = answered;
    error = code;
}

std::map<std::string, std::vector<std::string>> RequestRecord::changedKeys(std::size_t maximum) const {
    std::map<std::string, std::set<std::string>> keys;
    for (const Value& change : _changes.kept) {
        std::set<std::string>& section = keys[std::string(change.dictionary()->text("section"))];
        if (section.size() < maximum) {
            section.emplace(change.dictionary()->text("key"));
        }
    }
    std::map<std::string, std::vector<std::string>> listed;
    for (auto& [section, names] : keys) {
        listed[section].assign(names.begin(), names.end());
    }
    return listed;
}

Dictionary RequestRecord::describe(bool withReports) const {
    constexpr const char* names[] = {"waiting", "running", "done"};
    Dictionary text{{"request", id},       {"state", names[static_cast<int>(state)]},
                    {"plugin", plugin},    {"command", command},
                    {"uid", peer.uid},     {"pid", peer.pid},
                    {"received", received}};
    text.set("checkOnly", checkOnly ? Value(true) : Value());
    if (state == State::running) {
        text.set("since", since);
    }
    if (state == State::done) {
        text.set("milliseconds", milliseconds);
        text.set("status", status);
        text.set("error", error.empty() ? Value() : Value(error));
    }
    text.set("log", _log);
    text.set("logLinesDropped", countOrNull(_logDropped));
    if (withReports) {
        text.set("changes", _changes.kept);
        text.set("changesDropped", countOrNull(_changes.reported - _changes.kept.size()));
        text.set("notDone", _notDone.kept);
        text.set("notDoneDropped", countOrNull(_notDone.reported - _notDone.kept.size()));
    }
    return text;
}

std::shared_ptr<RequestRecord> RequestLog::begin(const Exchange& exchange) {
    auto record = std::make_shared<RequestRecord>();
    record->id = exchange.id();
    record->peer = exchange.peer();
    record->received = std::chrono::floor<std::chrono::seconds>(std::chrono::system_clock::now());
    record->arrival = std::chrono::steady_clock::now();
    return record;
}

std::shared_ptr<RequestRecord> RequestLog::add(const Exchange& exchange) {
    auto record = begin(exchange);
    add(record);
    return record;
}

void RequestLog::add(std::shared_ptr<RequestRecord> record) {
    _records.push_back(std::move(record));
    std::size_t bytes = 0;
    for (const auto& one : _records) {
        bytes += one->reportBytes();
    }
    // A request that waits or runs is never forgotten: a client that lost its connection asks what becomes of it.
    for (auto one = _records.begin();
         one != _records.end() && (_records.size() > length || bytes > reportBytesMaximum);) {
        if ((*one)->state == RequestRecord::State::done) {
            bytes -= (*one)->reportBytes();
            one = _records.erase(one);
        } else {
            ++one;
        }
    }
}

const RequestRecord* RequestLog::find(std::string_view id) const {
    const auto found =
        std::find_if(_records.begin(), _records.end(), [&](const auto& record) { return sameId(record->id, id); });
    return found == _records.end() ? nullptr : found->get();
}

void RequestLog::hide(const SecretPart& part) {
    for (const auto& record : _records) {
        record->hide(part);
    }
}

bool RequestLog::use(std::string_view id) {
    std::string key(id);
    std::transform(key.begin(), key.end(), key.begin(), lowerCase);
    if (!_used.insert(key).second) {
        return false;
    }
    _usedInOrder.push_back(std::move(key));
    if (_usedInOrder.size() > usedMaximum) {
        _used.erase(_usedInOrder.front());
        _usedInOrder.pop_front();
    }
    return true;
}

}  // namespace adminhost
