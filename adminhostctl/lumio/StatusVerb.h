#pragma once

// "status": the service's state for people, and the daemon's own health beside it.

#include "adminhostctl/Verb.h"

#include <span>
#include <string>

namespace adminhost::ctl {

/// Returns done while the service is running, runningWithIssue, stopped, or unknown. Unknown includes a daemon that
/// cannot be reached or refuses.
[[nodiscard]] ExitStatus serviceStatus(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
