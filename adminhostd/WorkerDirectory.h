#pragma once

// The worker's directory: its nodes as the configuration describes them.

#include "adminhostd/Protocol.h"

#include <chrono>
#include <optional>
#include <string>
#include <vector>

namespace adminhost {

/// Sets the nodes of the default session. Returns what is wrong with them, a text for people each. A node with
/// settings that cannot be used stays in its place, and everything that it is asked fails.
[[nodiscard]] std::vector<std::string> configureDirectory(const protocol::Configure& configuration);

/// Tries to reach every node, for five seconds at most, and returns a text for people for each that cannot be.
[[nodiscard]] std::vector<std::string> unreachableNodes();

/// The people and groups that a client asks for. People that are asked for by name or UUID have their groups.
[[nodiscard]] Result<Array> accountsFor(const protocol::FindAccounts& order);

/// How much time a command's directory work has; nullopt: only its deadline counts. That is so for commands on
/// accounts: half of a change to a directory is worse than a late end.
[[nodiscard]] std::optional<std::chrono::milliseconds> directoryBudget(const Command* command,
                                                                       std::chrono::milliseconds configured);

}  // namespace adminhost
