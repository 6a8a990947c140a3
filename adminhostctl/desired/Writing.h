#pragma once

// How every verb that changes something does it: read, plan, write what was planned on, compare what is there then.

#include "adminhostctl/Verb.h"
#include "adminhostctl/desired/Plan.h"

#include <string>

namespace adminhost::ctl {

/// The state as it is now, what it consists of, and its revision.
struct CurrentState {
    StateForm form;
    State state;
    std::string revision;
    std::vector<ReportedGap> unread;  ///< parts that the service could not read: they look empty
};

/// The state, or only one section of it. Throws Failure when the service does not return it.
[[nodiscard]] CurrentState readState(const Context& context, const std::string& section = {});

/// Throws Failure(failed) with the reasons if parts of the state could not be read.
void requireWhole(const CurrentState& current);

/// The plan in the asked format.
void showPlan(const Context& context, const Plan& plan);

/// Changes what differs from what is wanted, and prints what. Nothing is sent when nothing differs. The write is
/// refused by the daemon when another client has changed something since the reading. A change that moves settings
/// files is written before the elements, which are planned again on what is there then. Returns failed after
/// naming each change that was not applied, and undetermined when the answer is missing and reading and the daemon's
/// report do not show what was written. Nothing is ever written twice.
[[nodiscard]] ExitStatus carryOut(const Context& context, const Wanted& wanted, const CurrentState& current);

}  // namespace adminhost::ctl
