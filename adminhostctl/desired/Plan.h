#pragma once

// Plans the changes that turn the current state into the desired one. No input, no output.

#include "adminhostctl/desired/State.h"
#include "platform/value/Value.h"

#include <map>
#include <set>
#include <string>
#include <vector>

namespace adminhost::ctl {

/// The desired state of one element. Fields that are absent stay as they are.
struct WantedElement {
    std::string name;                                       ///< label, or identity if people may use it
    Dictionary fields;                                      ///< by their key
    std::map<std::string, std::vector<std::string>> lists;  ///< labels of people, by the name of their list in a file
    std::vector<Person> denied;                             ///< by label; an empty kind means all kinds
    bool remove = false;
    /// Write a text that is a secret already. It cannot be compared, so a file, which may be applied many times, does
    /// not set this.
    bool writeSecret = false;
    std::string shownAs{};  ///< what changes call it; empty: its name
    // For messages: "host.toml, line 2, column 15".
    std::string place{};                                       ///< of the element; empty if it is not from a file
    std::map<std::string, std::vector<std::string>> places{};  ///< of the people in `lists`
};

struct Wanted {
    Dictionary settings;
    std::map<std::string, std::string> secrets;                  ///< secret settings; "" removes the stored one
    std::map<std::string, std::vector<WantedElement>> elements;  ///< by section
    std::set<std::string> removeUnlisted;                        ///< switches that are on
    std::set<std::string> only;                                  ///< sections that may change; empty: all
    /// Also write a name that the write itself looks up, although its result is not known in advance.
    bool lookUp = false;
};

struct PlannedChange {
    std::string entry{};     ///< "SECTION.KEY", "SECTION.\"Main hall\".LIST.anna"
    std::string from{};      ///< for people, with its unit, or words in parentheses; "(secret)" for every secret
    std::string to{};        ///< the same
    std::string keyPath{};   ///< its key path in the request: "ROOT.LIST.0"
    bool hidden = false;     ///< reading does not show whether it was applied
    std::string identity{};  ///< of the element
    std::string key{};       ///< of the setting, or of the element; of a person the name of the list in a file
    // For programs.
    std::string section{};  ///< "settings", "cameras", ...
    std::string name{};     ///< of the element, as people know it
    Value before{};         ///< null: not set, not present, not in the list; "(secret)" for every secret
    Value after{};          ///< the same; true for an element without a text of its own
    bool secret = false;

    /// Compares the change itself, without its place in the request.
    friend bool operator==(const PlannedChange& a, const PlannedChange& b) {
        return a.entry == b.entry && a.from == b.from && a.to == b.to;
    }
};

struct Plan {
    std::vector<PlannedChange> changes;
    std::vector<std::string> notes;         ///< desired values that are left as they are, and what remains to be done
    std::vector<std::string> consequences;  ///< of changes that are not made yet
    Dictionary root;                        ///< what to write; empty if nothing changes
    std::vector<std::string> restart;       ///< commands that have to be run for a change to take effect
    bool moves = false;                     ///< other settings files, perhaps another database, are used from then on
    std::vector<std::string> movedAlong;    ///< stored settings of those files that the plan does not write
};

/// Returns true if the service looks the written value up and stores the result instead.
[[nodiscard]] bool isLookedUp(const DescribedKey& setting, const Value& value);

/// The value as people read it: yes or no, a number with the unit of its setting, a text in quotes.
[[nodiscard]] std::string valueForPeople(const Value& value, const std::string& unit = {});

/// The value of a change for programs: a secret is "(secret)".
[[nodiscard]] Value valueForPrograms(const Value& value, bool secret);

/// Returns the changes from `state` to what is wanted. Throws Failure(usage), which names the place, if something
/// wanted does not fit the state.
[[nodiscard]] Plan planOf(const StateForm& form, const Wanted& wanted, const State& state);

}  // namespace adminhost::ctl
