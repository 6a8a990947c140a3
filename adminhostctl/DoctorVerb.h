#pragma once

// "doctor": the checks of the installation on one page.

#include "adminhostctl/Verb.h"

#include <span>
#include <string>

namespace adminhost::ctl {

/// Prints the daemon's checks and those that need no daemon. Returns warnings or failures if one of them is not fine,
/// and notChecked if the daemon cannot be asked.
[[nodiscard]] ExitStatus doctor(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
