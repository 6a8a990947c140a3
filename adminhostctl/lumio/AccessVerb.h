#pragma once

// What a person or a group may use.

#include "adminhostctl/Verb.h"

#include <span>
#include <string>

namespace adminhost::ctl {

/// Prints the cameras and workflows that a person or group may use: those that are open to everyone, and those whose
/// list has the person or one of the person's groups, direct or nested. The name is a short name or a UUID; with
/// --group it names a group, else a person if there is one. Throws Failure if the directory or the state cannot be read
/// whole, because a part of it would look as if there were no access.
[[nodiscard]] ExitStatus accessOf(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
