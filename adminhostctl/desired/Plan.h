#pragma once

// From what is wanted and what is there to the changes that make the one the other. No input, no output.

#include "adminhostctl/desired/State.h"
#include "platform/value/Value.h"

#include <optional>
#include <span>
#include <string>
#include <vector>

namespace adminhost::ctl {

struct WantedProperty {
    std::string name;
    std::optional<std::string> value;  ///< nothing: as it is
    std::optional<bool> isProtected;   ///< nothing: as it is
    bool remove = false;
    /// Write the value of a protected property too. It cannot be compared, so a file that is applied again and again
    /// does not ask for it.
    bool writeSecret = false;
};

struct WantedCamera {
    std::string key;  ///< name or UUID
    std::optional<bool> restricted;
    std::optional<std::vector<std::string>> users;  ///< short names; nothing: as they are
    std::optional<std::vector<std::string>> groups;
    std::vector<ListedPerson> denied;  ///< by short name; an empty kind means both
    bool remove = false;
};

struct Wanted {
    Dictionary settings;
    std::optional<std::string> password;  ///< of the grid account; "" removes the stored one
    std::vector<WantedProperty> properties;
    std::vector<WantedCamera> cameras;
    bool removeProperties = false;  ///< remove those that are not listed
    bool removePeople = false;      ///< of each list of users or groups that is given
    /// Write a controller's name that the write itself looks up, although what it finds cannot be told before.
    bool lookUpController = false;
};

struct PlannedChange {
    std::string entry;  ///< "settings.server_port", "cameras.\"Main hall\".users.anna"
    std::string from;   ///< as TOML writes it, or words in parentheses; "(secret)" for every secret
    std::string to;

    friend bool operator==(const PlannedChange&, const PlannedChange&) = default;
};

struct Plan {
    std::vector<PlannedChange> changes;
    std::vector<std::string> notes;  ///< what is wanted and left as it is, and why
    Dictionary configuration;        ///< for writeSettings; empty when nothing changes
    bool restart = false;            ///< whether the service has to be restarted for a change to take effect
};

/// Whether writing the controller's name makes the service look it up and store the host name that it finds.
[[nodiscard]] bool isLookedUp(const std::string& controller);

/// Throws Failure(usage) when something wanted does not fit what is there, naming it.
[[nodiscard]] Plan planOf(const Wanted& wanted, const State& state);

/// The changes of the plan that did not take, `from` being what is there instead. `settingsWritten` says that the
/// service wrote its settings files. What no reading shows is judged by the log lines of the writing request.
[[nodiscard]] std::vector<PlannedChange> changesNotTaken(const Wanted& wanted, const Plan& plan, const State& before,
                                                         const State& after, bool settingsWritten,
                                                         std::span<const std::string> log);

}  // namespace adminhost::ctl
