#include "adminhostd/Worker.h"

#include "adminhostd/AuditJournal.h"
#include "adminhostd/ChangeNotes.h"
#include "adminhostd/ForwardingSink.h"
#include "adminhostd/Frame.h"
#include "adminhostd/KeptWrite.h"
#include "adminhostd/LoadedPlugins.h"
#include "adminhostd/Login.h"
#include "adminhostd/OwnMemory.h"
#include "adminhostd/Peer.h"
#include "adminhostd/PluginCall.h"
#include "adminhostd/PluginLogs.h"
#include "adminhostd/PluginTrial.h"
#include "adminhostd/PrivateDirectory.h"
#include "adminhostd/Protocol.h"
#include "adminhostd/ToolConfiguration.h"
#include "adminhostd/UnitProcesses.h"
#include "adminhostd/WorkerAnswer.h"
#include "adminhostd/WorkerChecks.h"
#include "adminhostd/WorkerDirectory.h"
#include "adminhostd/WriteLock.h"
#include "platform/directory/DirectoryRequest.h"
#include "platform/files/Path.h"
#include "platform/log/Log.h"
#include "platform/release/Release.h"
#include "platform/service/ServiceState.h"
#include "platform/task/Task.h"
#include "platform/task/TaskBounds.h"
#include "platform/task/ToolRegister.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <exception>
#include <functional>
#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <fmt/format.h>
#include <malloc.h>
#include <poll.h>
#include <unistd.h>

namespace adminhost {
namespace {

using Clock = std::chrono::steady_clock;
using protocol::Outcome;

/// Bytes of a message after which freed memory is returned to the system.
constexpr std::size_t largeMessage = std::size_t{1} << 20U;

/// For an order that has no deadline: the front ends it earlier.
constexpr std::chrono::milliseconds undatedBound = std::chrono::minutes(5);

/// The time of an order. A front that was taken over may send any number.
std::chrono::milliseconds timeOf(const auto& order) {
    constexpr std::chrono::milliseconds longest = std::chrono::hours(48);
    return std::chrono::milliseconds(std::min<std::uint64_t>(order.milliseconds, longest.count()));
}

/// Shows the monitor until when an operation runs, so that it can end one whose front has died.
void setDeadline(std::optional<Clock::time_point> deadline) {
    if (ToolRegister* const shared = toolRegister()) {
        shared->setDeadline(deadline);
    }
}

constexpr const char* frontHasEnded = "The daemon that sent the request has ended.";

/// Of the messages to a worker: returns false for those without an answer of their own.
template <class Message>
constexpr bool asksForSomething = true;
template <>
constexpr bool asksForSomething<protocol::Configure> = false;
template <>
constexpr bool asksForSomething<protocol::Proceed> = false;
template <>
constexpr bool asksForSomething<protocol::Recorded> = false;

bool send(int descriptor, protocol::ToFront message) {
    return writeFrame(descriptor, protocol::frameOf(std::move(message)));
}

class Worker {
  public:
    explicit Worker(int descriptor) : _descriptor(descriptor), _sink(descriptor) {}
    Worker(const Worker&) = delete;
    Worker& operator=(const Worker&) = delete;

    int run();

  private:
    /// Serves one message; returns the process's exit status if it cannot go on.
    std::optional<int> serve(protocol::ToWorker message);
    protocol::Hello configure(const protocol::Configure& configuration);
    static void probeDirectory(const protocol::Configure& configuration);
    /// Each runs once, and only in a worker that holds the lock for changes.
    void removeLeftovers();
    void removeSettingsLeftovers();

    protocol::Answer answer(const protocol::Perform& order);
    protocol::Answer answer(const protocol::FindAccounts& order);
    protocol::Answer answer(const protocol::ReadHistory& order);
    [[nodiscard]] protocol::Answer answer(const protocol::Diagnose& order) const;
    [[nodiscard]] protocol::Answer answer(const protocol::ReadLog& order) const;
    [[nodiscard]] protocol::Answer answer(const protocol::ReadAudit& order) const;
    protocol::Answer perform(const LoadedPlugin& loaded, const protocol::Perform& order);

    int _descriptor;
    ForwardingSink _sink;
    FrameReader _reader;
    ChangeNotes _notes{_descriptor, _reader, _sink};
    uid_t _frontAccount = 0;
    std::chrono::milliseconds _directoryTime{};  ///< for all directory work of a request
    OwnMemory _memory;
    LoadedPlugins _plugins;
    FileDescriptor _toolConfiguration;  ///< open: the directory stays if the front is killed and another one starts
    bool _configured = false;
    bool _leftoversRemoved = false;
    bool _settingsLeftoversRemoved = false;
    bool _returnMemory = false;  ///< a large message has been freed
    /// What the answer was written from. It is freed once the answer has been sent, because freeing and clearing a long
    /// listing takes as long as writing it.
    Value _spent;
};

/// Returns true if a command may change something: also one that the plug-in does not name, because it is not known to
/// only read.
bool changes(const LoadedPlugin& loaded, const std::string& name) {
    const Command* command = commandNamed(loaded, name);
    return command == nullptr || command->access != Access::read;
}

/// Returns true if the other end of a conversation has been closed.
bool isClosed(int descriptor) {
    pollfd entry{descriptor, POLLRDHUP, 0};
    return ::poll(&entry, 1, 0) > 0;
}

protocol::Answer notLoaded(const std::string& plugin) {
    return broken("The plug-in \"" + plugin + "\" is not loaded.");
}

/// The answer to a command if something that it needs is not usable, or not known to be.
protocol::Answer unmetAnswer(const UnmetNeed& need, BodyForm form) {
    if (need.state == Probe::State::unusable) {
        return errorAnswer("REQUIREMENT_NOT_MET", need.message, form);
    }
    protocol::Answer later;
    later.outcome = Outcome::later;
    later.error = "REQUIREMENT_UNKNOWN";
    later.message = need.message;
    return later;
}

/// Empty if there is none: past the deadline, when tools were killed, it may be that of half of the settings.
std::string shownRevision(const LoadedPlugin& loaded, Result<std::string> revision, Clock::time_point deadline) {
    if (revision && Clock::now() < deadline) {
        return *std::move(revision);
    }
    logEvent(fmt::format("adminhostd: {} failed to give its revision: {}", loaded.name,
                         revision ? "the deadline has passed" : textOf(revision.error().description)));
    return {};
}

protocol::Hello Worker::configure(const protocol::Configure& configuration) {
    setSystemRoot(configuration.root);
    _frontAccount = static_cast<uid_t>(configuration.frontAccount);
    _directoryTime = std::chrono::milliseconds(configuration.directoryMilliseconds);
    const std::vector<std::string> nodeProblems = configureDirectory(configuration);
    for (const std::string& problem : nodeProblems) {
        logEvent("adminhostd: " + problem);
    }
    if (configuration.serviceManager) {
        setServiceManager(*configuration.serviceManager);
    }
    _plugins.setToolEnvironment(configuration.toolEnvironment);
    if (const auto found = configuration.toolEnvironment.find(toolConfigurationVariable);
        found != configuration.toolEnvironment.end()) {
        _toolConfiguration = holdDirectory(found->second);
    }

    protocol::Hello hello;
    hello.refused = configuration.refused;
    const std::vector<DiskPath> files(configuration.plugins.begin(), configuration.plugins.end());
    const auto reasons = tryPlugins(files);
    for (std::size_t i = 0; i < files.size(); ++i) {
        if (reasons[i]) {
            hello.refused.push_back({files[i].text(), *reasons[i]});
        } else if (const auto loaded = _plugins.load(files[i], configuration.languages)) {
            hello.plugins.push_back({loaded->name, loaded->version, files[i].text(), loaded->commands});
        } else {
            hello.refused.push_back({files[i].text(), textOf(loaded.error().description)});
        }
    }
    if (configuration.tryOnly) {
        // The directory's servers are not tried: the check runs before each start, which must not wait for them.
        for (const auto& problems : {nodeProblems, _plugins.needsThatAreNotUsable()}) {
            hello.problems.insert(hello.problems.end(), problems.begin(), problems.end());
        }
    }
    return hello;
}

/// Logs the nodes that cannot be reached. What is wrong with their settings is logged by the worker that serves.
void Worker::probeDirectory(const protocol::Configure& configuration) {
    setSystemRoot(configuration.root);
    static_cast<void>(configureDirectory(configuration));
    for (const std::string& problem : unreachableNodes()) {
        logEvent("adminhostd: " + problem);
    }
}

void Worker::removeLeftovers() {
    if (!std::exchange(_leftoversRemoved, true)) {
        _plugins.removeLeftovers();
    }
}

void Worker::removeSettingsLeftovers() {
    if (!std::exchange(_settingsLeftoversRemoved, true)) {
        _plugins.removeSettingsLeftovers();
    }
}

protocol::Answer Worker::perform(const LoadedPlugin& loaded, const protocol::Perform& order) {
    Plugin& plugin = *loaded.plugin;
    const auto failed = [&](const Error& error) {
        logEvent(fmt::format("adminhostd: {}/{} failed: {}", loaded.name, order.command, textOf(error.description)));
        return errorAnswer("INTERNAL_ERROR",
                           "The operation failed inside the plug-in. The log lines of this request give the reason.",
                           order.form);
    };

    auto findings = callPlugin([&] { return plugin.check(order.command, order.arguments); });
    if (!findings) {
        return failed(findings.error());
    }
    protocol::Answer answer;
    if (!findings->empty()) {
        answer.outcome = Outcome::refused;
        answer.findings = *std::move(findings);
        return answer;
    }
    if (order.checkOnly) {
        return written(Outcome::answered, Dictionary{{"findings", Array()}}, order.form);
    }
    const auto deadline = Clock::now() + timeOf(order);
    if (const auto unmet = _plugins.unmetNeed(loaded, order.command, timeOf(order))) {
        return unmetAnswer(*unmet, order.form);
    }
    std::optional<WriteLock::Held> held;
    if (changes(loaded, order.command)) {
        auto lock = WriteLock::tryToHold();
        if (!lock) {
            answer.outcome = lock.error().domain == WriteLock::busy ? Outcome::locked : Outcome::broken;
            answer.message = textOf(lock.error().description);
            return answer;
        }
        held.emplace(*std::move(lock));
        // A worker that was stopped may have missed the end of its front, and later writes of another worker.
        if (isClosed(_descriptor)) {
            return broken(frontHasEnded);
        }
        removeLeftovers();
        removeSettingsLeftovers();
        _notes.reportUnfinished();
    }
    _plugins.enter(loaded);
    setTaskDeadline(deadline);
    if (!order.revisions.empty()) {
        const auto revision = callPlugin([&] { return plugin.revision(); });
        if (!revision) {
            return failed(revision.error());
        }
        if (std::find(order.revisions.begin(), order.revisions.end(), *revision) == order.revisions.end()) {
            answer.outcome = Outcome::conflict;
            return answer;
        }
    }
    if (held && !_notes.begin(loaded, order)) {
        return broken(frontHasEnded);
    }
    // Only a command that may change something has a history: the name of a reader is not looked up.
    std::optional<KeptWrite> write;
    if (held) {
        write.emplace(loaded, Dictionary{{"when", order.received},
                                         {"who", loginText(order.caller.uid, order.caller.login)},
                                         {"uid", std::uint64_t{order.caller.uid}},
                                         {"command", order.command},
                                         {"request", order.request}});
    }
    if (write && order.keepsHistory) {
        write->begin();
    }
    const auto revisionNow = [&] { return callPlugin([&] { return plugin.revision(); }); };
    std::optional<Result<std::string>> ofRead;
    const bool readsWithRevision = order.showsRevision && !held;  // a write has the revision that it leaves
    _sink.beginOperation(loaded.name, readsWithRevision ? [&] { ofRead = revisionNow(); } : std::function<void()>());
    auto response = callPlugin([&] { return plugin.perform(order.command, order.arguments); });
    const ReportedChanges reported = _sink.takeChanges();
    if (write) {
        write->complete(reported);
    }
    if (!response) {
        return failed(response.error());
    }
    // If a tool was killed at the deadline, the answer would mislead: only the overrun is reported.
    if (Clock::now() >= deadline) {
        answer.outcome = Outcome::overrun;
        return answer;
    }
    switch (response->kind()) {
        case Response::Kind::nothing:
            answer.outcome = Outcome::nothing;
            break;
        case Response::Kind::dictionary:
            _spent = std::move(response->dictionary());
            answer = written(Outcome::answered, _spent, order.form);
            break;
        case Response::Kind::error:
            _spent = std::move(response->dictionary());
            answer = written(Outcome::error, _spent, order.form);
            break;
    }
    if (order.showsRevision && response->kind() != Response::Kind::error) {
        answer.revision = shownRevision(loaded, ofRead ? *std::move(ofRead) : revisionNow(), deadline);
    }
    return answer;
}

protocol::Answer Worker::answer(const protocol::Perform& order) {
    const LoadedPlugin* found = _plugins.named(order.plugin);
    if (found == nullptr) {
        return notLoaded(order.plugin);
    }
    const DirectoryRequestScope directory(directoryBudget(commandNamed(*found, order.command), _directoryTime));
    protocol::Answer answered = perform(*found, order);
    _notes.end(answered.outcome);
    return answered;
}

protocol::Answer Worker::answer(const protocol::ReadHistory& order) {
    const LoadedPlugin* found = _plugins.named(order.plugin);
    if (found == nullptr) {
        return notLoaded(order.plugin);
    }
    const auto history = historyOf(*found);
    if (!history) {
        return broken(textOf(history.error().description));
    }
    Dictionary response;
    response.set("history", history->settingsEntries());
    response.set("resources", history->resourceEntries());
    return written(Outcome::answered, std::move(response), order.form);
}

protocol::Answer Worker::answer(const protocol::FindAccounts& order) {
    const DirectoryRequestScope directory(_directoryTime);
    Result<Array> entries = accountsFor(order);
    if (!entries) {
        return errorAnswer("DIRECTORY_UNAVAILABLE", textOf(entries.error()), order.form);
    }
    return written(Outcome::answered, Dictionary{{"entries", *std::move(entries)}}, order.form);
}

protocol::Answer Worker::answer(const protocol::Diagnose& order) const {
    const auto deadline = Clock::now() + timeOf(order);
    setTaskDeadline(deadline);
    protocol::Answer answer;
    answer.outcome = Outcome::checked;
    answer.checks = workerChecks();
    for (const LoadedPlugin& loaded : _plugins.all()) {
        _plugins.enter(loaded);
        setTaskDeadline(deadline);
        for (Diagnosis& check : checksOf(loaded)) {
            answer.checks.push_back(std::move(check));
        }
    }
    return answer;
}

protocol::Answer Worker::answer(const protocol::ReadLog& order) const {
    return logAnswer(_plugins.all(), order);
}

protocol::Answer Worker::answer(const protocol::ReadAudit& order) const {
    return auditAnswer(order, _frontAccount, unitOf(controlGroupOf(::getpid())));  // the front is in the same unit
}

std::optional<int> Worker::serve(protocol::ToWorker message) {
    const auto* configuration = std::get_if<protocol::Configure>(&message);
    // The monitor sends the configuration, before the front can send anything.
    if (std::exchange(_configured, true) == (configuration != nullptr)) {
        logEvent("adminhostd: the worker was sent what it may not be sent, and ends");
        return 1;
    }
    if (configuration != nullptr) {
        if (configuration->build != ADMINHOST_RELEASE ", " ADMINHOST_BUILD_IDENTITY) {
            logEvent("adminhostd: the worker is of another release than the daemon; restart the daemon");
            return 1;
        }
        if (configuration->probeDirectory) {
            probeDirectory(*configuration);
            return 0;
        }
        if (!send(_descriptor, configure(*configuration))) {
            return 1;
        }
        if (!configuration->tryOnly) {
            // Tickets and the like must not wait for a write. What is beside settings files does: they may be on a
            // shared file system that hangs, which must not hold up requests that do not use it. If another process
            // holds the lock, the first write removes both.
            if (const auto lock = WriteLock::tryToHold()) {
                removeLeftovers();
                _notes.reportUnfinished();
            }
        }
        return std::nullopt;
    }
    if (const auto* recorded = std::get_if<protocol::Recorded>(&message)) {
        _notes.recorded(*recorded);
        return std::nullopt;
    }
    protocol::Answer answered;
    const std::uint64_t toolsBefore = startedTasks();
    const std::uint64_t lookupsBefore = directoryLookups();
    try {
        answered = std::visit(
            [&]<class Order>(const Order& order) {
                auto bound = undatedBound;
                if constexpr (requires { order.milliseconds; }) {
                    bound = timeOf(order);
                }
                setDeadline(Clock::now() + bound);
                if constexpr (!asksForSomething<Order>) {
                    return broken({});
                } else {
                    return answer(order);
                }
            },
            message);
    } catch (const std::exception& exception) {
        answered = broken(exception.what());
    }
    setTaskDeadline(std::nullopt);
    setDeadline(std::nullopt);
    answered.toolRuns = startedTasks() - toolsBefore;
    answered.directoryLookups = directoryLookups() - lookupsBefore;
    answered.residentBytes = _memory.bytes().value_or(0);
    const Frame frame = protocol::frameOf(std::move(answered));
    _returnMemory |= frame.bytes.size() >= largeMessage;
    const bool sent =
        writeFrame(_descriptor, frame) || send(_descriptor, broken("The answer is too large to be sent."));
    _spent = Value();
    return sent ? std::nullopt : std::optional(1);
}

int Worker::run() {
    // The front acts on a signal for the whole group or service: the running operation must not be interrupted.
    for (const int signal : {SIGTERM, SIGINT, SIGHUP, SIGPIPE}) {
        static_cast<void>(std::signal(signal, SIG_IGN));
    }
    prepareForTasks();
    for (;;) {
        auto frame = readFrame(_descriptor, _reader);
        if (!frame) {
            return 0;
        }
        _returnMemory |= frame->size >= largeMessage;
        auto message = protocol::toWorker(std::move(*frame));
        if (!message) {
            logEvent("adminhostd: the worker was sent what it cannot read: " + textOf(message.error().description));
            return 1;
        }
        if (const auto status = serve(*std::move(message))) {
            return *status;
        }
        if (_returnMemory) {
            ::malloc_trim(0);
            _returnMemory = false;
        }
    }
}

}  // namespace

int runWorker(int descriptor) {
    return Worker(descriptor).run();
}

}  // namespace adminhost
