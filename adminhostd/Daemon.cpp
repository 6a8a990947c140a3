#include "adminhostd/Daemon.h"

#include "adminhostd/ClearedStack.h"
#include "adminhostd/ConfigurationCopy.h"
#include "adminhostd/Front.h"
#include "adminhostd/FrontChecks.h"
#include "adminhostd/FrontRights.h"
#include "adminhostd/MonitorLink.h"
#include "adminhostd/Notify.h"
#include "platform/log/Log.h"

#include <algorithm>
#include <csignal>
#include <optional>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

#include <fmt/format.h>
#include <sys/signalfd.h>
#include <unistd.h>

namespace adminhost {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

constexpr auto runningBound = 10s;  ///< at a stop, for a running operation that only reads
constexpr int logPause = 100;       ///< milliseconds until the next try while the log cannot be written
constexpr auto logBound = 200ms;    ///< for the log's last events at the end
constexpr auto sendingBound = 2s;   ///< at a stop, for clients to read their answers

OperationQueue::Settings settingsOf(const Options& options) {
    const std::vector<DirectoryNodeOptions>& nodes = options.directory.nodes;
    return {options.queueLimit, options.deadline, options.queueLimitPerAccount,
            std::any_of(nodes.begin(), nodes.end(), [](const DirectoryNodeOptions& node) { return !node.local; })};
}

class Daemon {
  public:
    Daemon(const Options& options, FrontChecks checks, Permissions permissions, FileDescriptor signals,
           FileDescriptor link, FileDescriptor listener)
        : _options(options),
          _monitor(std::move(link)),
          _listener(std::move(listener)),
          _signals(std::move(signals)),
          _front(settingsOf(options), _monitor, std::move(checks), std::move(permissions)) {}

    void run() {
        for (;;) {
            // Clients that connect before the first worker is ready wait in the socket's backlog.
            if (!_server && _front.queue().settled() && !_stopping) {
                _front.setBodyBounds(_options.bounds.body);
                _server.emplace(std::move(_listener), _options.bounds,
                                [this](Exchange& exchange) { return _front.head(exchange); });
                notify("READY=1");
            }
            if (finished()) {
                return;
            }
            wait();
            const bool conversed = _front.queue().run(_entries);
            _front.events().run();
            if (_signalled || _monitor.closed()) {
                stop();
            }
            if (const auto configuration = _monitor.takeConfiguration(); configuration && !_stopping) {
                reload(*configuration);
            }
            const bool readBody = _server && _server->run(_entries);
            if (conversed || readBody) {
                clearUnusedStack();  // which may hold parts of requests and answers
            }
        }
    }

  private:
    void wait() {
        _entries.clear();
        _entries.push_back({_signals.get(), POLLIN, 0});
        if (_server) {
            _server->addTo(_entries);
        }
        _front.queue().addTo(_entries);
        int timeout = _server ? _server->timeout().value_or(-1) : -1;
        if (!flushLog()) {
            timeout = timeout < 0 ? logPause : std::min(timeout, logPause);
        }
        for (const auto& due : {_front.queue().due(), _front.events().due(), _stopBy}) {
            if (due) {
                const auto left = std::chrono::ceil<std::chrono::milliseconds>(*due - Clock::now()).count();
                const int bounded = static_cast<int>(std::clamp<std::int64_t>(left, 0, 60'000));
                timeout = timeout < 0 ? bounded : std::min(timeout, bounded);
            }
        }
        ::poll(_entries.data(), _entries.size(), timeout);
        if (_entries.front().revents != 0) {
            readSignals();
        }
    }

    void readSignals() {
        signalfd_siginfo signal{};
        while (::read(_signals.get(), &signal, sizeof signal) > 0) {
            _signalled = _signalled || signal.ssi_signo != SIGHUP;
        }
    }

    /// Applies a configuration that the monitor has read again. Requests that wait or run are not touched.
    void reload(const MonitorLink::Configuration& configuration) {
        Options read;
        try {
            read = readOptionsWith(_options.arguments, configurationIn(configuration.copy.get()));
        } catch (const std::runtime_error& error) {
            logEvent(fmt::format("adminhostd: the front does not use the new configuration: {}", error.what()));
            return;
        }
        static_cast<void>(keepFixedSettings(read, _options));  // the monitor has logged them
        _options = std::move(read);
        // Names of accounts are looked up again even if the tables are the same.
        _front.reconfigure(_options, Permissions(_options.permissions, _front.permissions().own(),
                                                 configurationFile(_options), &_front.permissions()));
        _front.setBodyBounds(_options.bounds.body);
        if (_server) {
            _server->setBodyMaximum(_options.bounds.bodyBytes);
        }
        logEvent("adminhostd: the configuration has been read again");
        _front.queue().reconfigure(settingsOf(_options), configuration.isNewForWorkers);
    }

    void stop() {
        if (_stopping) {
            return;
        }
        _stopping = true;
        _listener.close();
        if (_server) {
            _server->quiesce();
        }
        _front.events().stop();
        _front.queue().stop(runningBound);
    }

    bool finished() {
        if (!_stopping || !_front.queue().stopped()) {
            return false;
        }
        if (!_stopBy) {
            _stopBy = Clock::now() + sendingBound;
        }
        return !_server || _server->open() == 0 || Clock::now() >= *_stopBy;
    }

    Options _options;
    MonitorLink _monitor;
    FileDescriptor _listener;  ///< until there is a server
    FileDescriptor _signals;
    Front _front;
    std::optional<HttpServer> _server;
    bool _signalled = false;
    bool _stopping = false;
    std::optional<Clock::time_point> _stopBy;  ///< the end of the wait for clients, once no operation runs
    std::vector<pollfd> _entries;
};

}  // namespace

FileDescriptor stopSignals() {
    sigset_t signals;
    ::sigemptyset(&signals);
    ::sigaddset(&signals, SIGTERM);
    ::sigaddset(&signals, SIGINT);
    ::sigaddset(&signals, SIGHUP);
    ::sigprocmask(SIG_BLOCK, &signals, nullptr);
    static_cast<void>(std::signal(SIGPIPE, SIG_IGN));
    return FileDescriptor(::signalfd(-1, &signals, SFD_CLOEXEC | SFD_NONBLOCK));
}

int runDaemon(const Options& options, FileDescriptor signals, FileDescriptor link, FileDescriptor listener) {
    setLogSink(options.logToStandardError ? standardErrorSink() : syslogSink());
    const auto account = frontAccount(options);
    FrontChecks checks(options);
    Permissions permissions(options.permissions, ::geteuid(), configurationFile(options));
    dropFrontRights(account, options);
    Daemon(options, std::move(checks), std::move(permissions), std::move(signals), std::move(link), std::move(listener))
        .run();
    for (const auto end = Clock::now() + logBound; !flushLog() && Clock::now() < end;) {
        std::this_thread::sleep_for(10ms);
    }
    return 0;
}

}  // namespace adminhost
