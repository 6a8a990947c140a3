#pragma once

// "explain": one setting.

#include "adminhostctl/Verb.h"

#include <span>
#include <string>

namespace adminhost::ctl {

/// Prints what a setting is for, its type, unit, range and default, its value, whether a change needs a restart, and
/// when and by whom it was changed last, as far as the history goes back. Throws Failure(usage) if it is not a setting.
[[nodiscard]] ExitStatus explain(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
