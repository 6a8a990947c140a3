#pragma once

// Determines which changes of a plan were applied. No input, no output.

#include "adminhostctl/DaemonClient.h"
#include "adminhostctl/desired/Plan.h"

#include <optional>
#include <string>
#include <vector>

namespace adminhost::ctl {

/// A change that was not applied, and why as far as the daemon reports it.
struct FailedChange {
    PlannedChange change;  ///< its `from` is the value that is stored instead
    std::string reason;    ///< empty if there is no report
};

struct PlanOutcome {
    std::vector<PlannedChange> applied;
    std::vector<FailedChange> failed;
    std::vector<PlannedChange> undetermined;
};

/// Returns which changes of the plan were applied. `after` is the state that was read afterwards, nullopt if it cannot
/// be read. `answered`: the writing command returned no error. The state decides; for values that reading does not
/// show, and for people if their lists were not read completely, the daemon's report decides. People whose change is
/// reported as not carried out count as such, whatever their lists show.
[[nodiscard]] PlanOutcome outcomeOf(const StateForm& form, const Wanted& wanted, const Plan& plan, const State& before,
                                    const std::optional<State>& after, bool answered, const RequestReport& report);

}  // namespace adminhost::ctl
