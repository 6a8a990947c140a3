#include "adminhostd/WaitingOperations.h"

#include "adminhostd/Http.h"

#include <algorithm>
#include <iterator>
#include <utility>
#include <variant>

namespace adminhost {
namespace {

using Time = WaitingOperations::Clock::time_point;

/// When the operation is given up unless it runs; nullopt if it has no such bound.
std::optional<Time> endOf(const Operation& operation) {
    std::optional<Time> first;
    // The time of a change that did not get the lock counts from its first start.
    for (const auto& end : {operation.beginBy, operation.endBy, operation.locked ? operation.until : std::nullopt}) {
        if (end && (!first || *end < *first)) {
            first = end;
        }
    }
    return first;
}

/// The answers of these orders depend on nothing but the order and the state of the service.
bool isIdentical(const protocol::Perform& a, const protocol::Perform& b) {
    return a.plugin == b.plugin && a.command == b.command && a.form == b.form && a.showsRevision == b.showsRevision &&
           a.checkOnly == b.checkOnly && a.revisions == b.revisions && a.arguments == b.arguments;
}
bool isIdentical(const protocol::FindAccounts& a, const protocol::FindAccounts& b) {
    return a == b;
}
bool isIdentical(const protocol::ReadHistory& a, const protocol::ReadHistory& b) {
    return a == b;
}
/// Every other order has a run of its own.
bool isIdentical(const auto&, const auto&) {
    return false;
}

bool isIdentical(const Operation& a, const Operation& b) {
    return a.record->peer.uid == b.record->peer.uid &&
           std::visit([](const auto& x, const auto& y) { return isIdentical(x, y); }, a.order, b.order);
}

}  // namespace

std::optional<Time> WaitingOperations::due() const {
    std::optional<Time> first;
    for (const Operation& operation : _operations) {
        const auto end = endOf(operation);
        if (end && (!first || *end < *first)) {
            first = end;
        }
    }
    return first;
}

std::size_t WaitingOperations::countOf(uid_t uid) const noexcept {
    return static_cast<std::size_t>(std::count_if(_operations.begin(), _operations.end(),
                                                  [&](const Operation& one) { return one.record->peer.uid == uid; }));
}

void WaitingOperations::add(Operation operation) {
    auto place = _operations.end();
    if (operation.urgent) {
        const auto lastChange = std::find_if(_operations.rbegin(), _operations.rend(),
                                             [](const Operation& other) { return other.changes; });
        place = lastChange.base();
    }
    _operations.insert(place, std::move(operation));
}

void WaitingOperations::addAgain(Operation operation) {
    _operations.push_front(std::move(operation));
}

std::optional<Operation> WaitingOperations::takeNext(bool locked) {
    const auto found = std::find_if(_operations.begin(), _operations.end(),
                                    [&](const Operation& operation) { return !locked || !operation.changes; });
    if (found == _operations.end()) {
        return std::nullopt;
    }
    Operation operation = std::move(*found);
    _operations.erase(found);
    return operation;
}

std::vector<Operation> WaitingOperations::takeSharers(const Operation& operation, Time now,
                                                      std::chrono::milliseconds longest) {
    if (operation.changes || operation.endBy) {
        return {};
    }
    bool afterChange = false;
    return takeIf([&](const Operation& other) {
        afterChange = afterChange || other.changes;
        return !afterChange && other.endIfBegun(now, longest) >= operation.until && isIdentical(operation, other);
    });
}

std::vector<Operation> WaitingOperations::takeLate(Time now) {
    return takeIf([&](const Operation& operation) {
        const auto end = endOf(operation);
        return end && now >= *end;
    });
}

std::vector<Operation> WaitingOperations::takeAbandoned() {
    return takeIf([](const Operation& operation) { return operation.exchange->clientGone(); });
}

std::optional<Operation> WaitingOperations::take(const RequestRecord& request) {
    auto found = takeIf([&](const Operation& operation) { return operation.record.get() == &request; });
    return found.empty() ? std::nullopt : std::optional(std::move(found.front()));
}

std::vector<Operation> WaitingOperations::takeAll() {
    return takeIf([](const Operation&) { return true; });
}

std::vector<Operation> WaitingOperations::takeIf(const std::function<bool(const Operation&)>& condition) {
    std::vector<Operation> taken;
    auto kept = _operations.begin();
    for (auto one = _operations.begin(); one != _operations.end(); ++one) {
        if (condition(*one)) {
            taken.push_back(std::move(*one));
        } else {
            if (kept != one) {
                *kept = std::move(*one);
            }
            ++kept;
        }
    }
    _operations.erase(kept, _operations.end());
    return taken;
}

}  // namespace adminhost
