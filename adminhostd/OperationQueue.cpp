#include "adminhostd/OperationQueue.h"

#include "platform/log/Log.h"

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <utility>

#include <fmt/format.h>

namespace adminhost {
namespace {

using namespace std::chrono_literals;

constexpr auto startBound = 30s;
/// A worker kills its tools at the deadline and reports the overrun; one that does not is killed itself.
constexpr auto overrunGrace = 2s;
constexpr auto lockPause = 50ms;     ///< until the lock for changes is tried again
constexpr auto abandonedPause = 1s;  ///< between two looks for clients that have gone
constexpr int readingsAtOnce = 16;   ///< a worker that sends without end must not keep the front from its clients
constexpr auto firstPause = 100ms;
constexpr auto longestPause = 30s;

}  // namespace

OperationQueue::OperationQueue(const Settings& settings, MonitorLink& monitor, Events events)
    : _settings(settings), _monitor(monitor), _events(std::move(events)) {
    start();
}

std::optional<pid_t> OperationQueue::workerPid() const {
    return _worker ? _worker->pid() : std::nullopt;
}

std::optional<std::string> OperationQueue::workerProblem() const {
    return _state == State::paused || _waitsForLeft ? std::optional(_startProblem) : std::nullopt;
}

void OperationQueue::add(Operation operation) {
    _waiting.add(std::move(operation));
    if (!_abandonedFrom) {
        _abandonedFrom = Clock::now() + abandonedPause;
    }
    if (_stopping) {
        failWaiting(Unserved::Reason::stopping, "The daemon is being stopped.");
    } else if (_state == State::paused || _waitsForLeft) {
        failWaiting(Unserved::Reason::unavailable, _startProblem);
    } else if (_state == State::idle) {
        next();
    }
}

void OperationQueue::addTo(std::vector<pollfd>& entries) const {
    _monitor.addTo(entries);
    if (_worker) {
        _worker->addTo(entries);
    }
    _directoryProbe.addTo(entries);
}

std::optional<OperationQueue::Clock::time_point> OperationQueue::due() const {
    std::optional<Clock::time_point> first = _due;
    const auto consider = [&](const std::optional<Clock::time_point>& other) {
        first = first && other ? std::min(first, other) : first ? first : other;
    };
    consider(_directoryProbe.due());
    consider(_waiting.due());
    consider(_abandonedFrom);
    return first;
}

void OperationQueue::start() {
    ++_starts;
    _replaceWorker = false;
    _worker = WorkerProcess::start(_monitor);
    if (!_worker) {
        startFailed(fmt::format("cannot be started: {}", std::strerror(errno)));
        return;
    }
    _state = State::starting;
    _due = Clock::now() + startBound;
}

void OperationQueue::noteStart() {
    if (_worker && _worker->waitsFor() && !_waitsForLeft) {
        _waitsForLeft = true;
        _settled = true;
        _due.reset();
        _startProblem = fmt::format(
            "The worker of a front that has died (process {}) is finishing its request. The next worker is started "
            "when it has ended.",
            *_worker->waitsFor());
        _events.log("adminhostd: " + _startProblem);
        failWaiting(Unserved::Reason::unavailable, _startProblem);
    } else if (_waitsForLeft && (!_worker || !_worker->waitsFor())) {
        _waitsForLeft = false;
        if (_worker) {  // else its start has failed, and the next one has a time already
            _due = Clock::now() + startBound;
        }
    }
}

void OperationQueue::startFailed(const std::string& reason) {
    _worker.reset();
    _state = State::paused;
    _settled = true;
    _startProblem = "The worker " + reason + ".";
    _pause = std::clamp<std::chrono::milliseconds>(_pause * 2, firstPause, longestPause);
    _due = Clock::now() + _pause;
    _events.log("adminhostd: the worker " + reason + "; the next start is in " + std::to_string(_pause.count()) +
                " ms");
    failWaiting(Unserved::Reason::unavailable, _startProblem);
}

void OperationQueue::failWaiting(Unserved::Reason reason, const std::string& message) {
    for (const Operation& operation : _waiting.takeAll()) {
        _events.finished(operation, Unserved{reason, message});
    }
}

bool OperationQueue::run(std::span<const pollfd> polled) {
    _monitor.run(polled);
    noteStart();
    const bool conversed = _worker && converse(polled);
    if (_state == State::idle && !sendRecorded()) {
        endWorker("could not be sent which ends have been logged");
    }
    _directoryProbe.run(polled, _events.log);
    if (_due && Clock::now() >= *_due) {
        timeUp();
    }
    giveUpWaiting();
    return conversed;
}

void OperationQueue::giveUpWaiting() {
    const auto now = Clock::now();
    if (_abandonedFrom && now >= *_abandonedFrom) {
        dropAbandoned();
        _abandonedFrom = _waiting.empty() ? std::nullopt : std::optional(now + abandonedPause);
    }
    for (Operation& operation : _waiting.takeLate(now)) {
        if (operation.locked) {
            finishLocked(std::move(operation));
        } else if (operation.endBy && now >= *operation.endBy) {
            _events.finished(operation,
                             Unserved{Unserved::Reason::overrun,
                                      "The deadline passed while the request was waiting; nothing was done."});
        } else {
            _events.finished(operation,
                             Unserved{Unserved::Reason::notBegun, "The worker is busy with another request."});
        }
    }
}

bool OperationQueue::converse(std::span<const pollfd> polled) {
    // Checked first: then everything that the worker sent before its end is still read below.
    const bool ended = _worker->ending().has_value();
    if (!ended && !_worker->mayConverse(polled)) {
        return false;
    }
    const unsigned long asked = _starts;
    const auto same = [&] { return _worker && _starts == asked; };
    bool more = true;
    for (int i = 0; i < readingsAtOnce && more && same(); ++i) {
        more = _worker->converse();
        while (same()) {
            auto frame = _worker->next();
            if (!frame) {
                break;
            }
            receive(std::move(*frame));
        }
    }
    if (same() && _worker->broken()) {
        endWorker("sent what cannot be read");
    } else if (same() && ended && !more) {
        const std::string how = *_worker->ending();  // a copy, because the worker is destroyed below
        workerEnded(how);
    }
    return true;
}

void OperationQueue::receive(Frame frame) {
    auto message = protocol::toFront(std::move(frame));
    if (!message) {
        endWorker(fmt::format("sent what cannot be read ({})", message.error().description.value_or("")));
    } else if (!std::visit([&](auto& one) { return take(std::move(one)); }, *message)) {
        endWorker("sent what it was not asked");
    }
}

void OperationQueue::dropAbandoned() {
    for (const Operation& operation : _waiting.takeAbandoned()) {
        _events.finished(operation, Unserved{Unserved::Reason::abandoned, "The client went away before its turn."});
    }
}

void OperationQueue::forEachRecord(const std::function<void(RequestRecord&)>& function) {
    if (_running) {
        function(*_running->record);
        for (const Operation& sharer : _running->sharers) {
            function(*sharer.record);
        }
    }
}

bool OperationQueue::take(const protocol::Log& log) {
    forEachRecord([&](RequestRecord& record) { record.add(log.event); });
    _events.log(log.event);
    return true;
}

bool OperationQueue::take(const Change& change) {
    forEachRecord([&](RequestRecord& record) { record.add(change); });
    return _running.has_value();
}

bool OperationQueue::take(const NotDone& part) {
    forEachRecord([&](RequestRecord& record) { record.add(part); });
    return _running.has_value();
}

bool OperationQueue::take(const SecretPart& part) {
    if (_running) {
        _events.becomesSecret(part);
    }
    return _running.has_value();
}

bool OperationQueue::take(const protocol::Begun& begun) {
    if (!_running || !_running->changes || _running->record->id != begun.request) {
        return false;
    }
    // This note replaces that of an earlier request with the same id.
    std::erase(_recorded, begun.request);
    _events.begun(*_running, begun);
    return _worker->send(protocol::frameOf(protocol::Proceed{begun.request}));
}

bool OperationQueue::take(const protocol::Unfinished& request) {
    _events.unfinished(request);
    _recorded.push_back(request.request);
    return sendRecorded();
}

bool OperationQueue::sendRecorded() {
    if (_recorded.empty() || !flushLog()) {
        return true;
    }
    const std::vector<std::string> requests = std::exchange(_recorded, {});
    return std::all_of(requests.begin(), requests.end(), [&](const std::string& request) {
        return _worker->send(protocol::frameOf(protocol::Recorded{request}));
    });
}

bool OperationQueue::take(protocol::Hello hello) {
    if (_state != State::starting) {
        return false;
    }
    _events.hello(std::move(hello));
    _state = State::idle;
    _settled = true;
    _due.reset();
    _pause = 0ms;
    if (_settings.triesServers) {
        _directoryProbe.start(_monitor);
    }
    next();
    return true;
}

bool OperationQueue::take(protocol::Answer answer) {
    if (_state != State::busy) {
        return false;
    }
    _state = State::idle;
    _due.reset();
    _changesFrom.reset();
    _events.worked(answer);
    if (answer.outcome == protocol::Outcome::locked && _running->changes && !_stopping &&
        Clock::now() < *_running->until) {
        waitForLock(std::move(answer));
    } else {
        const std::shared_ptr<RequestRecord> record = _running->record;
        finish(std::move(answer));
        if (record->begun) {
            _recorded.push_back(record->id);
        }
        if (!sendRecorded()) {
            return false;
        }
    }
    next();
    return true;
}

void OperationQueue::endWorker(const std::string& why) {
    _worker->kill();
    workerEnded(why);
}

void OperationQueue::workerEnded(const std::string& how) {
    const State state = std::exchange(_state, State::paused);
    _due.reset();
    const bool started = _worker->pid().has_value();
    _worker.reset();
    if (state == State::starting) {
        startFailed(started ? how + " before it was ready" : how);
        return;
    }
    _events.log("adminhostd: the worker " + how);
    if (_running) {
        finish(Unserved{Unserved::Reason::failed,
                        "The process that ran the command " + how + ". What it had begun may be half done."});
    }
    if (!_stopping) {
        start();
    }
}

void OperationQueue::timeUp() {
    _due.reset();
    switch (_state) {
        case State::paused:
            if (!_stopping) {
                start();
            }
            break;
        case State::starting:
            endWorker("did not get ready in time and was killed");
            break;
        case State::busy:
            // A change is never reported as stopped: clients would take it as not run and send it again.
            finish(_stopping && !_running->changes
                       ? Unserved{Unserved::Reason::stopping, "The daemon was stopped before the command ended."}
                       : Unserved{Unserved::Reason::overrun, {}});
            endWorker("did not stop in time and was killed");
            break;
        case State::idle:
            next();
            break;
    }
}

void OperationQueue::reconfigure(const Settings& settings, bool replaceWorker) {
    _settings = settings;
    if (replaceWorker) {
        _directoryProbe = {};  // it tries servers of the old configuration
        _replaceWorker = true;
        next();
    }
    if (_state == State::paused && !_stopping) {
        _pause = 0ms;
        start();
    }
}

void OperationQueue::next() {
    if (_replaceWorker && _state == State::idle && !_stopping) {
        endWorker("is replaced, because the configuration has changed");
        return;
    }
    while (_state == State::idle && !_stopping && !_waiting.empty()) {
        const bool locked = _changesFrom && Clock::now() < *_changesFrom;
        auto operation = _waiting.takeNext(locked);
        if (!operation) {
            _due = _changesFrom;
            return;
        }
        if (operation->exchange->clientGone()) {
            _events.finished(*operation,
                             Unserved{Unserved::Reason::abandoned, "The client went away before its turn."});
        } else if (operation->locked && Clock::now() >= *operation->until) {
            finishLocked(*std::move(operation));
        } else {
            begin(*std::move(operation));
        }
    }
}

void OperationQueue::begin(Operation operation) {
    const auto now = Clock::now();
    if (!operation.until) {
        operation.until = operation.endIfBegun(now, _settings.deadline);
    }
    operation.sharers = _waiting.takeSharers(operation, now, _settings.deadline);
    const auto left = std::chrono::ceil<std::chrono::milliseconds>(*operation.until - now);
    std::visit(
        [&](auto& order) {
            if constexpr (requires { order.milliseconds; }) {
                order.milliseconds = static_cast<std::uint64_t>(std::max<std::int64_t>(left.count(), 0));
            }
        },
        operation.order);
    // Kept for a change, which may have to be sent again.
    const auto frame = protocol::frameOf(operation.changes ? operation.order : std::exchange(operation.order, {}));
    const bool sent = _worker->send(frame);
    _due = *operation.until + overrunGrace;
    _running = std::move(operation);
    if (!sent) {
        _due.reset();
        finish(Unserved{Unserved::Reason::tooLarge, "The request is too large to be passed on."});
        return;
    }
    forEachRecord([&](RequestRecord& record) {
        record.state = RequestRecord::State::running;
        record.since = std::chrono::floor<std::chrono::seconds>(std::chrono::system_clock::now());
        record.start = now;
    });
    _state = State::busy;
}

void OperationQueue::waitForLock(protocol::Answer answer) {
    Operation operation = *std::exchange(_running, std::nullopt);
    operation.record->state = RequestRecord::State::waiting;
    operation.locked = std::move(answer);
    _changesFrom = std::min(Clock::now() + lockPause, *operation.until);
    _waiting.addAgain(std::move(operation));
}

void OperationQueue::finishLocked(Operation operation) {
    auto answer = *std::move(operation.locked);
    _events.finished(operation, std::move(answer));
}

void OperationQueue::finish(Ending ending) {
    const Operation operation = std::move(*_running);
    _running.reset();
    _events.finished(operation, std::move(ending));
}

bool OperationQueue::cancel(const RequestRecord& request) {
    if (const auto operation = _waiting.take(request)) {
        _events.finished(*operation, Unserved{Unserved::Reason::cancelled, {}});
        return true;
    }
    return _running && !_running->changes && cancelRunning(request);
}

bool OperationQueue::cancelRunning(const RequestRecord& request) {
    const Unserved cancelled{Unserved::Reason::cancelled, {}};
    std::vector<Operation>& sharers = _running->sharers;
    const auto sharer =
        std::find_if(sharers.begin(), sharers.end(), [&](const auto& one) { return one.record.get() == &request; });
    if (sharer != sharers.end()) {
        const Operation operation = std::move(*sharer);
        sharers.erase(sharer);
        _events.finished(operation, cancelled);
        return true;
    }
    if (_running->record.get() != &request) {
        return false;
    }
    if (!sharers.empty()) {  // one of them goes on in its place
        Operation first = std::move(sharers.front());
        sharers.erase(sharers.begin());
        first.until = _running->until;
        first.sharers = std::move(sharers);
        const Operation operation = std::exchange(*_running, std::move(first));
        _events.finished(operation, cancelled);
        return true;
    }
    finish(cancelled);
    endWorker("was ended because its request was cancelled");
    return true;
}

void OperationQueue::stop(std::chrono::milliseconds bound) {
    if (_stopping) {
        return;
    }
    _stopping = true;
    failWaiting(Unserved::Reason::stopping, "The daemon is being stopped.");
    if (_state == State::busy) {
        if (!_running->changes) {
            _due = std::min(*_due, Clock::now() + bound);
        }
    } else {
        _due.reset();
    }
}

}  // namespace adminhost
