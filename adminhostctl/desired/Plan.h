#pragma once

// From what is wanted and what is there to the changes between them, and what became of the changes. No input, no
// output.

#include "adminhostctl/DaemonClient.h"
#include "adminhostctl/desired/State.h"
#include "platform/value/Value.h"

#include <map>
#include <optional>
#include <set>
#include <string>
#include <vector>

namespace adminhost::ctl {

/// What is wanted of one element. What is absent stays as it is.
struct WantedElement {
    std::string name;                                       ///< label, or identity where people may use it
    Dictionary fields;                                      ///< by their key
    std::map<std::string, std::vector<std::string>> lists;  ///< labels of people, by the name of their list in a file
    std::vector<Person> denied;                             ///< by label; an empty kind means all kinds
    bool remove = false;
    /// Write a text that is a secret already. It cannot be compared, so a file that is applied again and again does not
    /// ask for it.
    bool writeSecret = false;
};

struct Wanted {
    Dictionary settings;
    std::map<std::string, std::string> secrets;                  ///< secret settings; "" removes the stored one
    std::map<std::string, std::vector<WantedElement>> elements;  ///< by section
    std::set<std::string> removeUnlisted;                        ///< switches that are on
    /// Write a name that the write itself looks up, although what it finds is not known before.
    bool lookUp = false;
};

struct PlannedChange {
    std::string entry;     ///< "SECTION.KEY", "SECTION.\"Main hall\".LIST.anna"
    std::string from;      ///< as TOML writes it, or words in parentheses; "(secret)" for every secret
    std::string to;        ///< the same
    std::string keyPath;   ///< where in the request it is: "ROOT.LIST.0"
    bool hidden = false;   ///< reading does not show whether it was applied
    std::string identity;  ///< of the element
    std::string key;       ///< of the setting, or of the element

    /// Of what changes; where in the request it is does not matter.
    friend bool operator==(const PlannedChange& a, const PlannedChange& b) {
        return a.entry == b.entry && a.from == b.from && a.to == b.to;
    }
};

struct Plan {
    std::vector<PlannedChange> changes;
    std::vector<std::string> notes;    ///< what is wanted and left as it is, what follows from a change
    Dictionary root;                   ///< what to write; empty when nothing changes
    std::vector<std::string> restart;  ///< commands that have to be run for a change to take effect
    bool moves = false;                ///< other settings files, perhaps another database, are used from then on
};

/// Whether writing the value makes the service look it up and store what it finds.
[[nodiscard]] bool isLookedUp(const DescribedKey& setting, const Value& value);

/// Throws Failure(usage) when something wanted does not fit what is there, naming it.
[[nodiscard]] Plan planOf(const StateForm& form, const Wanted& wanted, const State& state);

/// A change that was not applied, and why as far as the daemon reports it.
struct FailedChange {
    PlannedChange change;  ///< its `from` is what is there instead
    std::string reason;    ///< empty if there is no report
};

struct PlanOutcome {
    std::vector<PlannedChange> applied;
    std::vector<FailedChange> failed;
    std::vector<PlannedChange> undetermined;
};

/// What became of the plan's changes. `after` is what reading shows afterwards, nothing when it cannot be read.
/// `answered`: the writing command returned no error. Reading decides; the daemon's report of what was
/// not carried out decides on what reading does not show.
[[nodiscard]] PlanOutcome outcomeOf(const StateForm& form, const Wanted& wanted, const Plan& plan, const State& before,
                                    const std::optional<State>& after, bool answered, const RequestReport& report);

}  // namespace adminhost::ctl
