#pragma once

// The queue of operations and the worker that runs them: one at a time, in the order of their arrival.
//
// A worker that crashes or overruns the deadline costs the operation that it ran; the next worker takes the others. One
// that does not even start costs all that wait, and is tried again after a pause that grows.

#include "adminhostd/History.h"
#include "adminhostd/WorkerProcess.h"

#include <chrono>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <vector>

namespace adminhost {

struct Operation {
    Exchange* exchange;
    std::shared_ptr<RequestRecord> record;
    Dictionary order;  ///< the payload for the worker, without the time that is left
};

// Outcomes of an operation that come from the queue itself, beside the worker's (Worker.h); each has a message.
namespace outcome {
constexpr const char* failed = "failed";            ///< the worker died
constexpr const char* unavailable = "unavailable";  ///< no worker starts
constexpr const char* stopping = "stopping";        ///< the daemon ends
constexpr const char* abandoned = "abandoned";      ///< the client went away before its turn
}  // namespace outcome

class OperationQueue {
  public:
    struct Settings {
        Dictionary configuration;            ///< what every worker is told first
        bool outputToStandardError = false;  ///< of the worker
        std::size_t limit = 64;
        std::chrono::milliseconds deadline{300'000};
    };
    struct Events {
        std::function<bool(const Dictionary&)> hello;  ///< whether it is of the form that Worker.h describes
        std::function<void(const std::string&)> log;   ///< an event of the plug-ins or of the queue, for the system log
        std::function<void(const Operation&, Dictionary)> finished;
    };

    OperationQueue(Settings settings, Events events);

    /// Whether another operation may wait.
    [[nodiscard]] bool full() const noexcept {
        const bool runsAtOnce = _state == State::idle && _waiting.empty();
        return !runsAtOnce && _waiting.size() >= _settings.limit;
    }
    void add(Operation operation);
    [[nodiscard]] const Operation* running() const noexcept { return _running ? &*_running : nullptr; }
    [[nodiscard]] std::size_t waiting() const noexcept { return _waiting.size(); }
    [[nodiscard]] std::optional<pid_t> workerPid() const;
    /// Whether the first worker has said hello, or could not.
    [[nodiscard]] bool settled() const noexcept { return _settled; }

    /// Answers what waits; the running operation has so long. Then no worker runs any more.
    void stop(std::chrono::milliseconds bound);
    [[nodiscard]] bool stopped() const noexcept { return _stopping && !_running; }

    void addTo(std::vector<pollfd>& entries) const;
    [[nodiscard]] std::optional<std::chrono::steady_clock::time_point> due() const { return _due; }
    /// Does whatever can be done without waiting.
    void run();

  private:
    using Clock = std::chrono::steady_clock;
    enum class State { paused, starting, idle, busy };

    void start();
    void startFailed(const std::string& reason);
    void take(Frame frame);
    void workerEnded(const std::string& how);
    void timeUp();
    void next();
    void finish(Dictionary answer);
    void failWaiting(const char* outcome, const std::string& message);

    Settings _settings;
    Events _events;
    State _state = State::paused;
    std::unique_ptr<WorkerProcess> _worker;
    std::vector<std::unique_ptr<WorkerProcess>> _dying;  ///< killed, but the kernel has not ended them yet
    std::deque<Operation> _waiting;
    std::optional<Operation> _running;
    std::optional<Clock::time_point> _due;  ///< when timeUp() has to act
    std::chrono::milliseconds _pause{0};
    std::string _startProblem;
    unsigned long _starts = 0;  ///< tells one worker from the next
    bool _settled = false;
    bool _stopping = false;
};

}  // namespace adminhost
