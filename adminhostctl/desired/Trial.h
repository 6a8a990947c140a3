#pragma once

// Trying settings before they are written, with the command that the service describes for it (state "try").

#include "adminhostctl/Verb.h"
#include "adminhostctl/desired/Plan.h"
#include "adminhostctl/desired/Writing.h"

#include <set>
#include <string>

namespace adminhost::ctl {

/// The settings that a trial needs together with this one, including itself; empty if no trial needs it.
[[nodiscard]] std::set<std::string> settingsTriedWith(const Context& context, const std::string& name);

/// Makes the trials that depend on one of the wanted settings, with the stored values of the others. A stored secret
/// cannot be read; the option --password-file gives it. Prints the outcome of each trial, or why it was not made.
/// Returns false if one of them failed. Throws Failure(usage) if no command of the service tries settings.
[[nodiscard]] bool passTrials(const Context& context, const Wanted& wanted, const CurrentState& current);

}  // namespace adminhost::ctl
