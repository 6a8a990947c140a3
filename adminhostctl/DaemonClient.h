#pragma once

// The daemon, as the verbs use it.

#include "adminhostctl/Connection.h"
#include "adminhostctl/Description.h"
#include "platform/value/Value.h"

#include <optional>
#include <string>
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

/// What a command answered, and the request that it answered to.
struct CommandAnswer {
    std::optional<Value> value;  ///< nothing for an answer of nothing
    std::string requestId;
    std::string revision;  ///< of what was read; empty where the command has none
};

class DaemonClient {
  public:
    explicit DaemonClient(std::string socketPath) : _connection(std::move(socketPath)) {}

    /// What runs now: the daemon's own account of itself.
    [[nodiscard]] Value overview();
    /// Every plug-in with its commands.
    [[nodiscard]] const std::vector<PluginInfo>& plugins();
    /// The command of that name, "PLUGIN/COMMAND" where two plug-ins have it. Throws Failure(usage) with the known
    /// ones.
    [[nodiscard]] CommandRef command(const std::string& name);
    /// The answer; nothing for an answer of nothing. Throws Failure with the daemon's message, its findings and, after
    /// a failure inside the service, the log lines of the request.
    [[nodiscard]] std::optional<Value> perform(const CommandRef& command, const Dictionary& request) {
        return ask(command, request).value;
    }
    /// The same, with the request's name and revision. A request that gives a revision fails unless it is still
    /// current.
    [[nodiscard]] CommandAnswer ask(const CommandRef& command, const Dictionary& request,
                                    const std::string& revision = {});
    /// What was logged while the request was performed; empty when the daemon does not know it any more.
    [[nodiscard]] std::vector<std::string> logLines(const std::string& requestId);

    /// What an address of the daemon answers. Throws as perform().
    [[nodiscard]] Value get(const std::string& path);

  private:
    [[noreturn]] void fail(const DaemonReply& answer);

    Connection _connection;
    std::optional<std::vector<PluginInfo>> _plugins;
};

/// What the answer says of a failure: a status that is not 0, or a key that the description lists under its errors.
/// One sentence; empty when the answer is none of an error.
[[nodiscard]] std::string errorOf(const Description& command, const Dictionary& answer);

}  // namespace adminhost::ctl
