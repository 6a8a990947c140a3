#include "adminhostd/OperationQueue.h"

#include "adminhostd/Worker.h"

#include <algorithm>
#include <cerrno>
#include <cstring>

#include <fmt/format.h>

namespace adminhost {
namespace {

using namespace std::chrono_literals;

constexpr auto startBound = 30s;
/// A worker kills its tools at the deadline and says so; one that does not is killed itself.
constexpr auto overrunGrace = 2s;
constexpr auto firstPause = 100ms;
constexpr auto longestPause = 30s;

Dictionary answerOf(const char* outcome, const std::string& message) {
    return {{"outcome", outcome}, {"message", message}};
}

}  // namespace

OperationQueue::OperationQueue(Settings settings, Events events)
    : _settings(std::move(settings)), _events(std::move(events)) {
    start();
}

std::optional<pid_t> OperationQueue::workerPid() const {
    return _worker ? std::optional(_worker->pid()) : std::nullopt;
}

void OperationQueue::add(Operation operation) {
    _waiting.push_back(std::move(operation));
    if (_stopping) {
        failWaiting(outcome::stopping, "The daemon is being stopped.");
    } else if (_state == State::paused) {
        failWaiting(outcome::unavailable, _startProblem);
    } else if (_state == State::idle) {
        next();
    }
}

void OperationQueue::addTo(std::vector<pollfd>& entries) const {
    if (_worker) {
        _worker->addTo(entries);
    }
    for (const auto& worker : _dying) {
        worker->addTo(entries);
    }
}

void OperationQueue::start() {
    ++_starts;
    _worker = WorkerProcess::start(_settings.outputToStandardError);
    if (!_worker || !_worker->send(FrameType::configure, _settings.configuration)) {
        startFailed(fmt::format("cannot be started: {}", std::strerror(errno)));
        return;
    }
    _state = State::starting;
    _due = Clock::now() + startBound;
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
    failWaiting(outcome::unavailable, _startProblem);
}

void OperationQueue::failWaiting(const char* outcome, const std::string& message) {
    while (!_waiting.empty()) {
        const Operation operation = std::move(_waiting.front());
        _waiting.pop_front();
        _events.finished(operation, answerOf(outcome, message));
    }
}

void OperationQueue::run() {
    if (_worker) {
        // Asked first: what a worker said before its end is read in any case.
        const auto ending = _worker->ending();
        const unsigned long asked = _starts;
        const bool more = _worker->converse();
        while (_worker && _starts == asked) {
            auto frame = _worker->next();
            if (!frame) {
                break;
            }
            take(std::move(*frame));
        }
        if (_worker && _starts == asked && _worker->broken()) {
            _worker->kill();
            workerEnded("sent what cannot be read");
        } else if (_worker && _starts == asked && ending && !more) {
            workerEnded(*ending);
        }
    }
    std::erase_if(_dying, [](const auto& worker) { return worker->ending().has_value(); });
    if (_due && Clock::now() >= *_due) {
        timeUp();
    }
}

void OperationQueue::take(Frame frame) {
    Dictionary* payload = frame.payload.dictionary();
    if (frame.type == FrameType::log && frame.payload.string() != nullptr) {
        if (_running) {
            _running->record->addLog(*frame.payload.string());
        }
        _events.log(*frame.payload.string());
    } else if (frame.type == FrameType::hello && _state == State::starting && payload != nullptr &&
               _events.hello(*payload)) {
        _state = State::idle;
        _settled = true;
        _due.reset();
        _pause = 0ms;
        next();
    } else if (frame.type == FrameType::answer && _state == State::busy && payload != nullptr) {
        _state = State::idle;
        _due.reset();
        finish(std::move(*payload));
        next();
    } else {
        _worker->kill();
        workerEnded("sent what it was not asked");
    }
}

void OperationQueue::workerEnded(const std::string& how) {
    const State state = std::exchange(_state, State::paused);
    _due.reset();
    if (!_worker->ending()) {
        _dying.push_back(std::move(_worker));
    }
    _worker.reset();
    if (state == State::starting) {
        startFailed(how + " before it was ready");
        return;
    }
    _events.log("adminhostd: the worker " + how);
    if (_running) {
        finish(answerOf(outcome::failed,
                        "The process that ran the command " + how + ". What it had begun may be half done."));
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
            _worker->kill();
            workerEnded("did not get ready in time and was killed");
            break;
        case State::busy: {
            const bool stopping = _stopping;
            Dictionary answer = stopping
                                    ? answerOf(outcome::stopping, "The daemon was stopped before the command ended.")
                                    : Dictionary{{"outcome", outcome::overrun}};
            finish(std::move(answer));
            _worker->kill();
            workerEnded("did not stop in time and was killed");
            break;
        }
        case State::idle:
            break;
    }
}

void OperationQueue::next() {
    while (_state == State::idle && !_stopping && !_waiting.empty()) {
        Operation operation = std::move(_waiting.front());
        _waiting.pop_front();
        if (operation.exchange->clientGone()) {
            _events.finished(operation, answerOf(outcome::abandoned, "The client went away before its turn."));
            continue;
        }
        operation.order.set("milliseconds", _settings.deadline.count());
        if (!_worker->send(FrameType::perform, operation.order)) {
            _events.finished(operation, answerOf(outcome::broken, "The request is too large to be passed on."));
            continue;
        }
        operation.order.clear();
        operation.record->state = RequestRecord::State::running;
        operation.record->since = std::chrono::floor<std::chrono::seconds>(std::chrono::system_clock::now());
        operation.record->start = Clock::now();
        _due = operation.record->start + _settings.deadline + overrunGrace;
        _running = std::move(operation);
        _state = State::busy;
    }
}

void OperationQueue::finish(Dictionary answer) {
    const Operation operation = std::move(*_running);
    _running.reset();
    _events.finished(operation, std::move(answer));
}

void OperationQueue::stop(std::chrono::milliseconds bound) {
    if (_stopping) {
        return;
    }
    _stopping = true;
    failWaiting(outcome::stopping, "The daemon is being stopped.");
    if (_state == State::busy) {
        _due = std::min(*_due, Clock::now() + bound);
    } else {
        _due.reset();
    }
}

}  // namespace adminhost
