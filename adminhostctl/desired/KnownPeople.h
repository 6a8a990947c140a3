#pragma once

// Checks the names of people in files against the directory.

#include "adminhostctl/Verb.h"
#include "adminhostctl/desired/Plan.h"
#include "adminhostctl/desired/State.h"

namespace adminhost::ctl {

/// Looks up every person and group that the files list and that is not in that list of the state yet. Throws
/// Failure(usage), which names each of them that the directory does not have, that has another kind, or whose name
/// several have, with file, line and column; Failure if the directory fails.
void requireKnownPeople(const Context& context, const StateForm& form, const Wanted& wanted, const State& state);

}  // namespace adminhost::ctl
