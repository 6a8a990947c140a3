#pragma once

// "audit": who has asked the daemon for what, what it has changed, and how it ended.

#include "adminhostctl/Verb.h"

#include <span>
#include <string>

namespace adminhost::ctl {

/// Prints the events of the audit that the options select and, with the option, those that come in from then on.
[[nodiscard]] ExitStatus audit(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
