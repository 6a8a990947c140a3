#pragma once

// The daemon as the verbs use it: its plug-ins and commands, their answers, and the outcome of a request.

#include "adminhostctl/Connection.h"
#include "adminhostctl/Description.h"
#include "adminhostctl/Failure.h"
#include "platform/value/Value.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

/// A plug-in that the daemon runs.
struct PluginInfo {
    std::string name;
    std::vector<Description> commands;
};

/// A command and the plug-in that serves it.
struct CommandRef {
    std::string plugin;
    Description description;
};

/// One thing that a request has changed, as the daemon reports it.
struct ReportedChange {
    std::string section;
    std::string identity;
    std::string name;
    std::string key;
    Value from;
    Value to;
    bool secret = false;
    bool unverified = false;  ///< nothing was changed if the element does not exist
};

/// A part of a request that was not carried out, or was ignored.
struct ReportedGap {
    std::string keyPath;  ///< "list.0.name"
    std::string reason;
    std::string toolMessage;
};

/// The daemon's record of a request.
struct RequestReport {
    enum class State {
        waiting,
        running,
        done,
        unknown,       ///< not known to the daemon: it never arrived, was forgotten, or the daemon was started again
        notReachable,  ///< there is no daemon to ask
    };
    State state = State::unknown;
    std::vector<ReportedChange> changes;
    std::vector<ReportedGap> notDone;
    std::uint64_t changesDropped = 0;  ///< changes that were applied and are not listed
    std::uint64_t notDoneDropped = 0;
    std::vector<std::string> log;
};

/// The answer to a request that may have changed something is missing: the connection was lost, the daemon reports a
/// failure (500) or the deadline (504), or the program was interrupted. Such a request is never sent again.
class LostAnswer : public Failure {
  public:
    LostAnswer(ExitStatus status, const std::string& message, std::string requestId)
        : Failure(status, message), _requestId(std::move(requestId)) {}
    [[nodiscard]] const std::string& requestId() const noexcept { return _requestId; }

  private:
    std::string _requestId;
};

/// The answer of a command.
struct CommandAnswer {
    std::optional<Value> value;  ///< absent if the command returns nothing
    std::string requestId;
    std::string revision;  ///< of what was read; empty where the command has none
    bool notDone = false;  ///< parts of the request were not carried out: see report()
};

/// The state has changed since it was read, so that the daemon refused a write that depends on its revision.
class Conflict : public Failure {
  public:
    explicit Conflict(const std::string& message) : Failure(ExitStatus::conflict, message) {}
};

/// Every call ends in time: after the given timeout, or else ten seconds after the deadline of its operation. If the
/// daemon asks to try again later (503 with Retry-After), the call is repeated after that time, three times at most.
class DaemonClient {
  public:
    /// With languages, they are sent with every request of a command that describes where (DescribedKey::filledWith).
    /// A timeout also shortens the operations' deadlines, so that they end before it.
    explicit DaemonClient(std::string socketPath, std::optional<std::vector<std::string>> languages = std::nullopt,
                          std::optional<std::chrono::milliseconds> timeout = std::nullopt)
        : DaemonClient(Connection(std::move(socketPath)), std::move(languages), timeout) {}
    explicit DaemonClient(Connection connection, std::optional<std::vector<std::string>> languages = std::nullopt,
                          std::optional<std::chrono::milliseconds> timeout = std::nullopt)
        : _connection(std::move(connection)), _languages(std::move(languages)), _timeout(timeout) {}

    /// The daemon's overview: the running request, how many wait, and the plug-ins. Throws Failure if the daemon's
    /// interface is older than this program needs.
    [[nodiscard]] Value overview();
    /// Every plug-in with its commands.
    [[nodiscard]] const std::vector<PluginInfo>& plugins();
    /// The command of that name, or "PLUGIN/COMMAND" if two plug-ins have it. Throws Failure(usage), which lists the
    /// known commands and suggests one of them or of the other words that would have been known.
    [[nodiscard]] CommandRef command(const std::string& name, const std::vector<std::string>& others = {});
    /// The command that reads, writes or tries the state that a file can describe, or lists names of its elements:
    /// state is "read", "write", "try" or "names". Throws Failure(usage) when no plug-in has one, or several have.
    [[nodiscard]] CommandRef stateCommand(std::string_view state);
    /// Sends the request once and returns the answer. A request with a revision fails unless the revision is still
    /// current. Throws Failure with the daemon's message, its findings and, after a failure inside the service, the log
    /// lines of the request. Throws LostAnswer if the command may change something and its answer is missing, and
    /// Conflict if the revision is no longer current.
    [[nodiscard]] CommandAnswer ask(const CommandRef& command, Dictionary request, const std::string& revision = {});
    /// Lets the daemon check a request, which is not carried out. Throws Failure as ask() does if it would be refused.
    void check(const CommandRef& command, const Dictionary& request);
    /// Returns the daemon's current record of a request. A daemon that cannot be reached is a state of the report, not
    /// a Failure.
    [[nodiscard]] RequestReport report(const std::string& requestId);
    /// The parts that a request did not carry out or could not read, with the reasons. Never empty if the answer has
    /// such parts: if the daemon no longer has the reasons, that is the reason.
    [[nodiscard]] std::vector<ReportedGap> gapsOf(const CommandAnswer& answer);
    /// As report(), but waits up to ten seconds while the request is not done or the daemon cannot be reached.
    [[nodiscard]] RequestReport settledReport(const std::string& requestId);

    /// The JSON value at an address of the daemon. Throws Failure as ask() does, Unavailable if it may be there soon.
    [[nodiscard]] Value get(const std::string& path);
    /// Cancels a request that waits or is running. Throws Failure as ask() does.
    void cancel(const std::string& requestId);
    /// The path of the daemon's socket, or the host on which the daemon is running.
    [[nodiscard]] const std::string& place() const noexcept { return _connection.place(); }
    /// Whether the daemon is on another machine.
    [[nodiscard]] bool isRemote() const noexcept { return _connection.isRemote(); }

  private:
    using Milliseconds = std::chrono::milliseconds;

    [[noreturn]] void fail(const DaemonReply& answer);
    /// Before the first call to the daemon of another machine, which may be of any release: asks for its overview, with
    /// a timeout of its own. Throws Failure as overview() does.
    void refuseOlderDaemon();
    /// The time that an operation with this limit (the daemon's without one) may take here.
    [[nodiscard]] Milliseconds timeoutOf(std::optional<std::chrono::seconds> deadline);
    template <typename Send>
    [[nodiscard]] DaemonReply patiently(Milliseconds timeout, const Send& send);

    Connection _connection;
    std::optional<std::vector<std::string>> _languages;
    std::optional<std::vector<PluginInfo>> _plugins;
    std::optional<Milliseconds> _timeout;
    std::optional<std::chrono::seconds> _deadline;  ///< the daemon's, once it is known
    bool _isChecked = false;                        ///< the daemon's interface is not too old
};

/// Adds the languages to the request, under the key that the description fills with languages, unless the request has
/// that key.
void addLanguages(Dictionary& request, const Description& command, const std::vector<std::string>& languages);

/// The log lines of a request as further lines of a message; empty if there are none.
[[nodiscard]] std::string logText(const std::vector<std::string>& lines);

/// Returns the failure in an answer as one sentence; empty if there is none. A failure is a key that the description
/// lists under its errors, unless its value is null or the number 0.
[[nodiscard]] std::string errorOf(const Description& command, const Dictionary& answer);

}  // namespace adminhost::ctl
