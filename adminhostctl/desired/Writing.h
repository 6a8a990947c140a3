#pragma once

// Carries out the changes of every verb: read the state, plan, write depending on the revision that was read, compare.

#include "adminhostctl/Verb.h"
#include "adminhostctl/desired/Plan.h"

#include <string>

namespace adminhost::ctl {

/// The current state, its form and its revision.
struct CurrentState {
    StateForm form;
    State state;
    std::string revision;
    std::vector<ReportedGap> unread;  ///< parts that the service could not read: they look empty
    std::string section;              ///< the only section that was read; empty: all of them
    std::vector<std::string> log{};   ///< log lines of the request, if parts could not be read
};

/// Reads the state, or only one section of it. A write that depends on it may then change only this section, and reads
/// only this section back. Throws Failure if the service does not return it.
[[nodiscard]] CurrentState readState(const Context& context, const std::string& section = {});

/// Reads the section of the settings only.
[[nodiscard]] CurrentState readSettingsSection(const Context& context);

/// Throws Failure(failed) with the reasons and the log lines if parts of the state could not be read.
void requireWhole(const CurrentState& current);

/// Prints the plan. Throws Failure if the daemon would refuse it.
[[nodiscard]] ExitStatus showOnly(const Context& context, const CurrentState& current, const Plan& plan);

/// What to do if another client has changed the state since it was read.
enum class Retry {
    never,
    /// Read again and try again, three times at most, while the parts of the state that change are as they were. A
    /// stored secret cannot be compared, so it is not tried again.
    ifUnchanged,
};

/// Changes what differs from the desired state, and prints the changes. Sends nothing if nothing differs. With
/// --dry-run, only prints them. The daemon refuses the write if another client has changed something since the state
/// was read; then throws Conflict, unless `retry` allows another attempt. A change that moves settings files is written
/// before the elements, which are then planned again for the new state. Names each change that was not applied and
/// returns failed. Returns undetermined if the answer is missing and neither the state nor the daemon's report shows
/// what was written. Nothing is ever written twice.
[[nodiscard]] ExitStatus carryOut(const Context& context, const Wanted& wanted, const CurrentState& current,
                                  Retry retry = Retry::never);

}  // namespace adminhost::ctl
