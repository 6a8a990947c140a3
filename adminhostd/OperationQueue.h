#pragma once

// The queue of operations and the worker that runs them: one at a time, in the order of WaitingOperations.h. Operations
// that only read overtake changes only while another process holds the lock for changes (WriteLock.h).
//
// If a worker crashes, overruns the deadline or breaks the protocol, the operation that it was running fails; the next
// worker runs the others. If a worker does not even start, all waiting operations fail, and the next start follows
// after a pause that grows.

#include "adminhostd/DirectoryProbe.h"
#include "adminhostd/Operation.h"
#include "adminhostd/Protocol.h"
#include "adminhostd/WaitingOperations.h"
#include "adminhostd/WorkerProcess.h"

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <variant>
#include <vector>

namespace adminhost {

/// Why an operation ended without a worker's answer.
struct Unserved {
    enum class Reason {
        failed,       ///< the worker died, or broke the protocol
        tooLarge,     ///< the request does not fit into a frame
        overrun,      ///< the deadline passed
        unavailable,  ///< no worker could be started
        stopping,     ///< the daemon is stopping
        abandoned,    ///< the client went away before its turn
        notBegun,     ///< it had to begin by a certain time, and another operation was still running
        cancelled,    ///< a client asked for its end
    };
    Reason reason = Reason::failed;
    std::string message;
};

class OperationQueue {
  public:
    struct Settings {
        std::size_t limit = 64;
        std::chrono::milliseconds deadline{300'000};
        std::size_t limitPerAccount = 16;
        bool triesServers = false;  ///< of the directory, after each start of a worker
    };
    using Ending = std::variant<protocol::Answer, Unserved>;
    struct Events {
        std::function<void(protocol::Hello)> hello;
        std::function<void(const std::string&)> log;  ///< an event of the plug-ins or of the queue, for the system log
        std::function<void(const SecretPart&)> becomesSecret;                 ///< reported by the running operation
        std::function<void(const Operation&, const protocol::Begun&)> begun;  ///< may change something from now on
        std::function<void(const protocol::Unfinished&)> unfinished;          ///< of an earlier worker
        std::function<void(const protocol::Answer&)> worked;     ///< for each run, also one without the lock
        std::function<void(const Operation&, Ending)> finished;  ///< also its sharers are finished
    };

    /// `monitor` starts the workers and configures them. It must outlive the queue.
    OperationQueue(const Settings& settings, MonitorLink& monitor, Events events);

    /// How many urgent operations may wait beyond the limit: a stop must not be refused because of many reads.
    static constexpr std::size_t urgentReserve = 4;

    /// Returns true if no further operation may wait, or no further one that is urgent.
    [[nodiscard]] bool full(bool urgent = false) const noexcept {
        // While the worker of an idle daemon is replaced, one request is accepted as if the worker was there.
        const bool runsNext = (_state == State::idle || _state == State::starting) && _waiting.empty();
        return !runsNext && _waiting.size() >= _settings.limit + (urgent ? urgentReserve : 0);
    }
    /// Returns true if no further operation of this account may wait.
    [[nodiscard]] bool fullFor(uid_t uid) const noexcept { return _waiting.countOf(uid) >= _settings.limitPerAccount; }
    [[nodiscard]] std::size_t limitPerAccount() const noexcept { return _settings.limitPerAccount; }
    void add(Operation operation);
    /// Ends the waiting operations whose clients have closed their connections.
    void dropAbandoned();
    /// Ends the operation of this request if it waits, or if it is running and only reads: then its worker is ended,
    /// unless others share the run. Returns false if it changes something now or is not in the queue.
    [[nodiscard]] bool cancel(const RequestRecord& request);
    [[nodiscard]] const Operation* running() const noexcept { return _running ? &*_running : nullptr; }
    [[nodiscard]] std::size_t waiting() const noexcept { return _waiting.size(); }
    /// How many operations may wait.
    [[nodiscard]] std::size_t limit() const noexcept { return _settings.limit; }
    /// How many workers have been started.
    [[nodiscard]] unsigned long starts() const noexcept { return _starts; }
    /// The longest time that an operation may run.
    [[nodiscard]] std::chrono::milliseconds deadline() const noexcept { return _settings.deadline; }
    [[nodiscard]] std::optional<pid_t> workerPid() const;
    /// Why there is no worker that can serve now; nullopt if there is one, or if one is being started.
    [[nodiscard]] std::optional<std::string> workerProblem() const;
    /// Returns true once the first worker has said hello, has failed to, or has to wait for the worker of an earlier
    /// front.
    [[nodiscard]] bool settled() const noexcept { return _settled; }

    /// Fails the waiting operations. A running operation that changes something keeps its whole time, because half of a
    /// change is worse than a late end. Another one has the time of the bound. No worker is started after that.
    void stop(std::chrono::milliseconds bound);
    [[nodiscard]] bool stopped() const noexcept { return _stopping && !_running; }

    /// Changes the settings. If the worker's configuration is an old one, another worker takes its place once no
    /// operation is running. Requests wait meanwhile. A worker whose start is paused is started at once.
    void reconfigure(const Settings& settings, bool replaceWorker);

    void addTo(std::vector<pollfd>& entries) const;
    [[nodiscard]] std::optional<std::chrono::steady_clock::time_point> due() const;
    /// Does everything that needs no waiting. Called after a poll of these entries, to which addTo() has added the
    /// queue's. Returns true if the worker has sent something.
    bool run(std::span<const pollfd> polled);

  private:
    using Clock = std::chrono::steady_clock;
    enum class State { paused, starting, idle, busy };

    void start();
    void noteStart();
    void startFailed(const std::string& reason);
    [[nodiscard]] bool converse(std::span<const pollfd> polled);
    void receive(Frame frame);
    /// Each returns true if the message was expected.
    bool take(protocol::Hello hello);
    bool take(const protocol::Log& log);
    bool take(const Change& change);
    bool take(const NotDone& part);
    bool take(const SecretPart& part);
    bool take(const protocol::Begun& begun);
    bool take(const protocol::Unfinished& request);
    bool take(protocol::Answer answer);
    /// Sends the worker the requests whose ends have been logged, once the log has nothing queued. Returns false
    /// if the worker cannot be sent them.
    [[nodiscard]] bool sendRecorded();
    void endWorker(const std::string& why);
    void workerEnded(const std::string& how);
    void timeUp();
    void giveUpWaiting();
    void next();
    /// Calls the function for the record of the running operation and those of its sharers.
    void forEachRecord(const std::function<void(RequestRecord&)>& function);
    bool cancelRunning(const RequestRecord& request);
    void begin(Operation operation);
    void waitForLock(protocol::Answer answer);
    /// Ends a change that did not get the lock until its deadline.
    void finishLocked(Operation operation);
    void finish(Ending ending);
    void failWaiting(Unserved::Reason reason, const std::string& message);

    Settings _settings;
    MonitorLink& _monitor;
    Events _events;
    State _state = State::paused;
    std::unique_ptr<WorkerProcess> _worker;
    DirectoryProbe _directoryProbe;
    WaitingOperations _waiting;
    std::optional<Clock::time_point> _abandonedFrom;  ///< when clients that have gone are looked for
    std::optional<Operation> _running;
    std::vector<std::string> _recorded;  ///< ended requests of which the worker keeps notes until their ends are logged
    std::optional<Clock::time_point> _changesFrom;  ///< when the lock for changes is to be tried again
    std::optional<Clock::time_point> _due;          ///< when timeUp() has to act
    std::chrono::milliseconds _pause{0};
    std::string _startProblem;
    unsigned long _starts = 0;    ///< distinguishes one worker from the next
    bool _waitsForLeft = false;   ///< the worker's start waits for the end of an earlier front's worker
    bool _replaceWorker = false;  ///< its configuration is an old one
    bool _settled = false;
    bool _stopping = false;
};

}  // namespace adminhost
