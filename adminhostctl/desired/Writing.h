#pragma once

// How every verb that changes something does it: read, plan, write what was planned on, compare what is there then.

#include "adminhostctl/Verb.h"
#include "adminhostctl/desired/Plan.h"

#include <string>

namespace adminhost::ctl {

/// What the service says now, and the revision that stands for it.
struct CurrentState {
    State state;
    std::string revision;
};

/// Throws Failure when the service cannot answer its configuration.
[[nodiscard]] CurrentState readState(const Context& context);

/// The description of a setting that writeSettings takes and that can be read again; null if there is none of the name.
[[nodiscard]] const DescribedKey* settingKey(const Description& writeSettings, const std::string& name);

/// The plan in the asked format.
void showPlan(const Context& context, const Plan& plan);

/// Changes what differs from what is wanted, and says what. Nothing is sent when nothing differs. The write is refused
/// by the daemon when another client has changed something since the reading. Answers answeredError after naming each
/// change that did not take, with the log lines of the request.
[[nodiscard]] ExitStatus carryOut(const Context& context, const Wanted& wanted, const CurrentState& current);

}  // namespace adminhost::ctl
