#pragma once

// Printing what comes in from now on.

#include "adminhostctl/Verb.h"

#include <functional>

namespace adminhost::ctl {

/// Calls the function, which prints what is new and returns true if there is more at once, until the output is closed
/// or a signal ends the program. A daemon that is being restarted is waited for.
void followUntilClosed(const Context& context, const std::function<bool()>& printNew);

}  // namespace adminhost::ctl
