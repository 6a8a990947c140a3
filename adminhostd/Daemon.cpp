#include "adminhostd/Daemon.h"

#include "adminhostd/ClearedStack.h"
#include "adminhostd/Front.h"
#include "adminhostd/FrontChecks.h"
#include "adminhostd/FrontRights.h"
#include "adminhostd/FrontStart.h"
#include "adminhostd/MonitorLink.h"
#include "adminhostd/Notify.h"
#include "adminhostd/PluginSelection.h"
#include "adminhostd/WorkerConfiguration.h"
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

class Daemon {
  public:
    Daemon(const Options& options, const PluginSelection& plugins, const std::string& toolDirectory, FrontChecks checks,
           Permissions permissions, FileDescriptor link, FileDescriptor listener)
        : _options(options),
          _plugins(plugins),
          _toolDirectory(toolDirectory),
          _monitor(std::move(link)),
          _listener(std::move(listener)),
          _signals(stopSignals()),
          _front({workerConfiguration(options, plugins, toolDirectory), _monitor, options.queueLimit, options.deadline,
                  options.queueLimitPerAccount},
                 plugins.refused, std::move(checks), std::move(permissions)) {}

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
            _front.queue().run(_entries);
            _front.events().run();
            if (_signalled || _monitor.closed()) {
                stop();
            }
            if (_reload && !_stopping) {
                reload();
            }
            if (_server) {
                _server->run();
                clearUnusedStack();  // of what has been served in this turn
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
            if (signal.ssi_signo == SIGHUP) {
                _reload = true;
            } else {
                _signalled = true;
            }
        }
    }

    /// Reads the configuration again. Requests that wait or run are not touched.
    void reload() {
        _reload = false;
        Options read;
        try {
            read = readOptionsAgain(_options.arguments);
        } catch (const std::runtime_error& error) {
            logEvent(fmt::format("adminhostd: the configuration was not read again, the old one stays in effect: {}",
                                 error.what()));
            return;
        }
        for (const std::string& key : keepFixedSettings(read, _options)) {
            logEvent(fmt::format("adminhostd: {} cannot be changed while the daemon is running; restart it", key));
        }
        if (read.plugins != _options.plugins || read.pluginDirectory != _options.pluginDirectory) {
            _plugins = selectPlugins(read);
        }
        std::optional<Permissions> permissions;
        if (read.permissions != _options.permissions) {
            permissions.emplace(read.permissions, _front.permissions().own(), configurationFile(read));
        }
        _options = std::move(read);
        _front.reconfigure(FrontChecks(_options), std::move(permissions), _plugins.refused);
        _front.setBodyBounds(_options.bounds.body);
        if (_server) {
            _server->setBodyMaximum(_options.bounds.bodyBytes);
        }
        logEvent("adminhostd: the configuration has been read again");
        _front.queue().reconfigure(workerConfiguration(_options, _plugins, _toolDirectory), _options.queueLimit,
                                   _options.deadline);
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
    PluginSelection _plugins;
    std::string _toolDirectory;
    MonitorLink _monitor;
    FileDescriptor _listener;  ///< until there is a server
    FileDescriptor _signals;
    Front _front;
    std::optional<HttpServer> _server;
    bool _signalled = false;
    bool _reload = false;
    bool _stopping = false;
    std::optional<Clock::time_point> _stopBy;  ///< the end of the wait for clients, once no operation runs
    std::vector<pollfd> _entries;
};

}  // namespace

int runDaemon(const Options& options, FileDescriptor link, FileDescriptor listener, const std::string& toolDirectory) {
    setLogSink(options.logToStandardError ? standardErrorSink() : syslogSink());
    const auto account = frontAccount(options);
    const PluginSelection plugins = selectPlugins(options);
    FrontChecks checks(options);
    Permissions permissions(options.permissions, ::geteuid(), configurationFile(options));
    dropFrontRights(account, options);
    Daemon(options, plugins, toolDirectory, std::move(checks), std::move(permissions), std::move(link),
           std::move(listener))
        .run();
    for (const auto end = Clock::now() + logBound; !flushLog() && Clock::now() < end;) {
        std::this_thread::sleep_for(10ms);
    }
    return 0;
}

}  // namespace adminhost
