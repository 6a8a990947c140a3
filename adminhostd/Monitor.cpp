#include "adminhostd/Monitor.h"

#include "adminhostd/ConfigurationCopy.h"
#include "adminhostd/Frame.h"
#include "adminhostd/FrontStart.h"
#include "adminhostd/ListeningSocket.h"
#include "adminhostd/MonitorMessage.h"
#include "adminhostd/Notify.h"
#include "adminhostd/PluginSelection.h"
#include "adminhostd/PrivateDirectory.h"
#include "adminhostd/Protocol.h"
#include "adminhostd/RunDirectory.h"
#include "adminhostd/ToolConfiguration.h"
#include "adminhostd/WorkerConfiguration.h"
#include "adminhostd/WorkerStart.h"
#include "platform/log/Log.h"
#include "platform/task/StartChild.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdint>
#include <list>
#include <optional>
#include <stdexcept>
#include <thread>
#include <utility>

#include <fmt/format.h>
#include <poll.h>
#include <sys/signalfd.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/wait.h>

namespace adminhost {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

constexpr std::size_t workerMaximum = 16;  ///< at the same time; a front in order has two
constexpr auto firstPause = 100ms;         ///< until a front that has died is started again
constexpr auto longestPause = 30s;
constexpr auto stableTime = 10s;      ///< a front that has run for so long has not died at its start
constexpr auto overrunGrace = 5s;     ///< in which worker or front end an operation that overruns its deadline
constexpr auto overrunInterval = 5s;  ///< at which the monitor looks for such an operation
constexpr auto unlinkedBound = 2s;    ///< in which a front that has closed its link must have ended
constexpr auto stopExtension = 10s;   ///< by which the service manager waits longer than a running operation may run
constexpr int messageMaximum = 32;    ///< that are read from the front in one go
constexpr int endingWait = 20;        ///< milliseconds for a killed worker
constexpr auto logPause = 100ms;      ///< until the next try while the log cannot be written
constexpr auto logBound = 200ms;      ///< for the log's last events at the end

FileDescriptor monitorSignals() {
    sigset_t signals;
    ::sigemptyset(&signals);
    for (const int signal : {SIGTERM, SIGINT, SIGHUP, SIGCHLD}) {
        ::sigaddset(&signals, signal);
    }
    ::sigprocmask(SIG_BLOCK, &signals, nullptr);
    static_cast<void>(std::signal(SIGPIPE, SIG_IGN));
    return FileDescriptor(::signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
}

class Monitor {
  public:
    Monitor(const Options& options, std::vector<std::string> arguments, ListeningSocket& socket,
            const std::string& toolDirectory)
        : _options(options), _arguments(std::move(arguments)), _socket(socket), _toolDirectory(toolDirectory) {}

    int run();

  private:
    struct Worker {
        std::uint32_t number;
        StartedWorker process;
        bool left;  ///< by a front that has died
    };

    void startFront();
    void startFrontAgain();
    std::chrono::milliseconds nextPause();
    void frontEnded(int status);
    void signalled();
    void stop();
    void extendStop();
    void reap();
    void receive();
    struct Wanted {
        std::uint32_t number;
        bool triesNodes;
    };

    void start(Wanted wanted);
    void startNow(Wanted wanted);
    void reload();
    void startWaiting();
    void kill(Worker& worker);
    bool collect(Worker& worker);
    void endOverruns();
    void endUnlinkedFront();
    void sendToFront(const MonitorMessage& message, std::span<const int> descriptors = {});
    [[nodiscard]] int timeout() const;

    Options _options;
    std::vector<std::string> _arguments;
    ListeningSocket& _socket;
    const std::string& _toolDirectory;
    protocol::Configure _configuration = workerConfiguration(_options, selectPlugins(_options), _toolDirectory);
    const FileDescriptor _firstCopy = sealedCopyOf({_options.configuration, _options.configurationText});
    FileDescriptor _copy = sealedCopyOf({_options.configuration, _options.configurationText});  ///< read last
    FileDescriptor _signals = monitorSignals();
    pid_t _front = 0;  ///< 0 while none is running
    FileDescriptor _link;
    Clock::time_point _frontSince;
    bool _served = false;  ///< a front has come so far as to ask for a worker
    std::optional<Clock::time_point> _frontDue;
    std::optional<Clock::time_point> _frontEndBy;  ///< set once it has closed its link
    std::chrono::milliseconds _pause{0};
    std::list<Worker> _workers;
    std::vector<Wanted> _waiting;  ///< that the front has asked for, while the last front's worker is running
    bool _stopping = false;
    Clock::time_point _stopBy;  ///< the latest deadline that the service manager has been asked to wait for
    int _status = 0;
};

int Monitor::run() {
    startFront();
    while (!_stopping || _front != 0 || !_workers.empty()) {
        pollfd entries[] = {{_signals.get(), POLLIN, 0}, {_link.get(), POLLIN, 0}};
        ::poll(entries, std::size(entries), timeout());
        if (entries[1].revents != 0) {
            receive();
        }
        if (entries[0].revents != 0) {
            signalled();
        }
        endOverruns();
        endUnlinkedFront();
        extendStop();
        if (_frontDue && Clock::now() >= *_frontDue) {
            startFrontAgain();
        }
    }
    return _status;
}

int Monitor::timeout() const {
    std::optional<Clock::time_point> due = _frontDue;
    const auto consider = [&](Clock::time_point time) { due = due ? std::min(*due, time) : time; };
    if (_frontEndBy) {
        consider(*_frontEndBy);
    }
    for (const Worker& worker : _workers) {
        // A worker does not announce its operations here: those that begin later are found at the next interval.
        const auto deadline = worker.process.tools.deadline();
        consider(deadline ? std::min(*deadline + overrunGrace, Clock::now() + overrunInterval)
                          : Clock::now() + overrunInterval);
    }
    if (!flushLog()) {
        consider(Clock::now() + logPause);
    }
    if (!due) {
        return -1;
    }
    return static_cast<int>(
        std::max<std::int64_t>(std::chrono::ceil<std::chrono::milliseconds>(*due - Clock::now()).count(), 0));
}

void Monitor::startFront() {
    _frontDue.reset();
    auto [ours, fronts] = monitorSocketPair();
    ChildPlan plan;
    plan.program = programOfDaemon("adminhostd-front");
    plan.arguments = _arguments;
    plan.arguments.front() = "adminhostd-front";
    plan.environment = processEnvironment();
    plan.descriptors = {-1,         STDOUT_FILENO, STDERR_FILENO, fronts.get(), _socket.descriptor(), _firstCopy.get(),
                        _copy.get()};
    auto started = startChild(plan);
    if (!started) {
        throw std::runtime_error(fmt::format("{} cannot be started: {}; install the daemon again", plan.program,
                                             started.error().description.value_or("")));
    }
    _front = started->pid;
    _link = std::move(ours);
    _frontSince = Clock::now();
}

/// A lack of memory or descriptors may pass. Workers are left to finish.
void Monitor::startFrontAgain() {
    try {
        startFront();
    } catch (const std::exception& error) {
        const auto pause = nextPause();
        _frontDue = Clock::now() + pause;
        logEvent(fmt::format("adminhostd: the front cannot be started again: {}; the next try is in {} ms",
                             error.what(), pause.count()));
    }
}

std::chrono::milliseconds Monitor::nextPause() {
    _pause = std::clamp<std::chrono::milliseconds>(_pause * 2, firstPause, longestPause);
    return _pause;
}

void Monitor::frontEnded(int status) {
    _front = 0;
    _frontEndBy.reset();
    _link.close();
    _waiting.clear();
    for (Worker& worker : _workers) {
        worker.left = true;
        // One that runs an operation finishes it; another one, such as a probe of the directory, has nothing to finish.
        if (!worker.process.tools.deadline()) {
            kill(worker);
        }
    }
    if (_stopping) {
        return;
    }
    if (!_served && WIFEXITED(status)) {
        // It has printed why it cannot start, and another one could not start either.
        _status = WEXITSTATUS(status);
        stop();
        return;
    }
    if (Clock::now() - _frontSince >= stableTime) {
        _pause = 0ms;
    }
    const auto pause = nextPause();
    _frontDue = Clock::now() + pause;
    logEvent(
        fmt::format("adminhostd: the front {}; the next one is started in {} ms", endingText(status), pause.count()));
}

void Monitor::stop() {
    _stopping = true;
    notify("STOPPING=1");
    _frontDue.reset();
    _socket.remove();
    _socket.close();
    if (_front != 0) {
        ::kill(_front, SIGTERM);
    }
}

/// An operation that is running at a stop may take longer than the unit's time for a stop.
void Monitor::extendStop() {
    if (!_stopping) {
        return;
    }
    for (const Worker& worker : _workers) {
        const auto deadline = worker.process.tools.deadline();
        if (deadline && *deadline > _stopBy) {
            _stopBy = *deadline;
            const auto left = std::chrono::ceil<std::chrono::microseconds>(*deadline + stopExtension - Clock::now());
            notify(fmt::format("EXTEND_TIMEOUT_USEC={}", left.count()));
        }
    }
}

void Monitor::signalled() {
    signalfd_siginfo signal{};
    while (::read(_signals.get(), &signal, sizeof signal) > 0) {
        if (signal.ssi_signo == SIGHUP) {
            reload();
        } else if (signal.ssi_signo != SIGCHLD && !_stopping) {
            stop();
        }
    }
    reap();
}

/// Reads the configuration again, for the workers that are started from now on, for this front and the next ones.
void Monitor::reload() {
    Options read;
    FileDescriptor copy;
    try {
        read = readOptionsAgain(_options.arguments);
        copy = sealedCopyOf({read.configuration, read.configurationText});
    } catch (const std::exception& error) {
        logEvent(fmt::format("adminhostd: the configuration was not read again, the old one stays in effect: {}",
                             error.what()));
        return;
    }
    for (const std::string& key : keepFixedSettings(read, _options)) {
        logEvent(fmt::format("adminhostd: {} cannot be changed while the daemon is running; restart it", key));
    }
    protocol::Configure configuration = workerConfiguration(read, selectPlugins(read), _toolDirectory);
    const bool isNewForWorkers = configuration != _configuration;
    _configuration = std::move(configuration);
    _options = std::move(read);
    _copy = std::move(copy);
    const int descriptor = _copy.get();
    sendToFront({MonitorMessage::Kind::configuration, 0, 0, isNewForWorkers ? 1 : 0}, {&descriptor, 1});
}

void Monitor::reap() {
    siginfo_t ended{};
    if (_front != 0 && ::waitid(P_PID, static_cast<id_t>(_front), &ended, WEXITED | WNOHANG | WNOWAIT) == 0 &&
        ended.si_pid == _front) {
        // What it asked for before its end does not matter any more, but a worker must be known. It is reaped
        // afterwards, so that its process id is not another's if it must be killed for what it has sent.
        receive();
        int status = 0;
        ::waitpid(_front, &status, 0);
        frontEnded(status);
    }
    std::erase_if(_workers, [&](Worker& worker) { return collect(worker); });
    startWaiting();
}

bool Monitor::collect(Worker& worker) {
    int status = 0;
    if (::waitpid(worker.process.pid, &status, WNOHANG) != worker.process.pid) {
        return false;
    }
    worker.process.tools.killRemaining();
    if (worker.left) {
        logEvent(fmt::format("adminhostd: the worker of the last front {}", endingText(status)));
    } else {
        sendToFront({MonitorMessage::Kind::ended, worker.number, worker.process.pid, status});
    }
    return true;
}

void Monitor::receive() {
    using Kind = ReceivedMessage::Kind;
    // The others wait for the next turn: a front that sends without end does not keep the monitor from the rest.
    for (int i = 0; i < messageMaximum && _link.isOpen(); ++i) {
        const ReceivedMessage received = receiveMonitorMessage(_link.get());
        if (received.kind == Kind::none) {
            return;
        }
        if (received.kind == Kind::closed) {
            _link.close();
            _frontEndBy = Clock::now() + unlinkedBound;
            return;
        }
        const std::uint32_t number = received.message.worker;
        const auto found = std::find_if(_workers.begin(), _workers.end(),
                                        [&](const Worker& worker) { return worker.number == number && !worker.left; });
        if (received.kind == Kind::message && received.message.kind == MonitorMessage::Kind::start && _front != 0 &&
            found == _workers.end()) {
            start({number, received.message.status == 1});
        } else if (received.kind == Kind::message && received.message.kind == MonitorMessage::Kind::kill) {
            std::erase_if(_waiting, [&](const Wanted& wanted) { return wanted.number == number; });
            if (found != _workers.end()) {
                kill(*found);
                if (collect(*found)) {
                    _workers.erase(found);
                }
            }
        } else {
            logEvent("adminhostd: the front sent what it may not send, and is ended");
            ::kill(_front, SIGKILL);
            return;
        }
    }
}

void Monitor::start(Wanted wanted) {
    const std::uint32_t number = wanted.number;
    _served = true;
    const auto left = std::find_if(_workers.begin(), _workers.end(), [](const Worker& worker) { return worker.left; });
    if (_workers.size() + _waiting.size() >= workerMaximum) {
        sendToFront({MonitorMessage::Kind::start, number, 0, EAGAIN});
    } else if (left != _workers.end()) {
        _waiting.push_back(wanted);
        sendToFront({MonitorMessage::Kind::start, number, left->process.pid, EBUSY});
    } else {
        startNow(wanted);
    }
}

void Monitor::startWaiting() {
    if (std::none_of(_workers.begin(), _workers.end(), [](const Worker& worker) { return worker.left; })) {
        for (const Wanted& wanted : std::exchange(_waiting, {})) {
            startNow(wanted);
        }
    }
}

void Monitor::startNow(Wanted wanted) {
    const std::uint32_t number = wanted.number;
    auto started = startWorker(_options.logToStandardError);
    if (!started) {
        sendToFront({MonitorMessage::Kind::start, number, 0, static_cast<std::int32_t>(started.error().code)});
        return;
    }
    // The configuration is in the conversation before the front gets its end: a front that was taken over must not
    // choose what the worker loads, or where it works.
    protocol::Configure configuration = _configuration;
    configuration.probeDirectory = wanted.triesNodes;
    const timeval bound{5, 0};
    ::setsockopt(started->conversation.get(), SOL_SOCKET, SO_SNDTIMEO, &bound, sizeof bound);
    if (!writeFrame(started->conversation.get(), protocol::frameOf(std::move(configuration)))) {
        // Reaped when it has ended: one that waits for a dead mount must not hold up the monitor.
        ::kill(started->pid, SIGKILL);
        sendToFront({MonitorMessage::Kind::start, number, 0, EIO});
        started->conversation.close();
        _workers.push_back({number, *std::move(started), false});
        return;
    }
    const int descriptors[] = {started->conversation.get(), started->process.get()};
    sendToFront({MonitorMessage::Kind::start, number, started->pid, 0}, descriptors);
    started->conversation.close();  // the worker must see the front's end
    _workers.push_back({number, *std::move(started), false});
}

void Monitor::kill(Worker& worker) {
    ::kill(worker.process.pid, SIGKILL);
    // Its tools must have ended before the next operation.
    pollfd entry{worker.process.process.get(), POLLIN, 0};
    if (::poll(&entry, 1, endingWait) <= 0) {
        // The kernel cannot end it yet, because it waits for a dead mount. It starts no tool any more, and cannot reap
        // those it has started: their process ids are still theirs. It is reaped later itself.
        worker.process.tools.killRemaining();
    }
}

void Monitor::endOverruns() {
    for (Worker& worker : _workers) {
        const auto deadline = worker.process.tools.deadline();
        if (deadline && Clock::now() >= *deadline + overrunGrace) {
            worker.process.tools.setDeadline(std::nullopt);
            logEvent(
                fmt::format("adminhostd: the worker {} has overrun its deadline, and is killed", worker.process.pid));
            kill(worker);
        }
    }
}

/// A front closes its link only when it ends. One that goes on could neither be given workers nor be waited for.
void Monitor::endUnlinkedFront() {
    if (_front != 0 && _frontEndBy && Clock::now() >= *_frontEndBy) {
        _frontEndBy.reset();
        logEvent("adminhostd: the front has closed its link to the monitor, and is ended");
        ::kill(_front, SIGKILL);
    }
}

void Monitor::sendToFront(const MonitorMessage& message, std::span<const int> descriptors) {
    if (_link.isOpen() && !sendMonitorMessage(_link.get(), message, descriptors)) {
        // It does not read: without this message it would wait for ever.
        ::kill(_front, SIGKILL);
    }
}

ListeningSocket listeningSocket(const Options& options) {
    FileDescriptor inherited = inheritedSocket();
    if (!inherited.isOpen()) {
        return {socketPath(options), groupOf(options.socketGroup)};
    }
    if (!options.socketGroup.empty()) {
        throw std::runtime_error(
            "socket_group is set, but the service manager creates the socket; set SocketGroup= in adminhostd.socket "
            "and "
            "remove socket_group from the configuration");
    }
    return {std::move(inherited), socketPath(options)};
}

}  // namespace

int runMonitor(const Options& options, std::vector<std::string> arguments) {
    setLogSink(options.logToStandardError ? standardErrorSink() : syslogSink());
    ListeningSocket socket = listeningSocket(options);
    removeAbandonedDirectories(privateParent(options));
    const ToolConfiguration tools(privateParent(options));
    const int status = Monitor(options, std::move(arguments), socket, tools.directory()).run();
    for (const auto end = Clock::now() + logBound; !flushLog() && Clock::now() < end;) {
        std::this_thread::sleep_for(10ms);
    }
    return status;
}

}  // namespace adminhost
