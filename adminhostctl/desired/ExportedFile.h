#pragma once

// Writes a state down as a file of the desired state (DesiredFile.h).

#include "adminhostctl/desired/State.h"

#include <string>

namespace adminhost::ctl {

/// Returns the file of a state. Its plan for that state has no change. A value that the file cannot carry (a secret, an
/// element whose name is not unique) is a comment, and so is a setting of the host's identity. Throws Failure(failed)
/// when the service did not list a section: without it, the file would look as if all of its elements had been removed.
[[nodiscard]] std::string exportOf(const StateForm& form, const State& state);

}  // namespace adminhost::ctl
