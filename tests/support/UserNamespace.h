#pragma once

// Runs a program as root of a user namespace that has other accounts as well: there it can give files away and drop its
// rights, as root of a machine can.

#include "tests/support/Program.h"

#include <string>
#include <vector>

namespace adminhost::test {

/// Runs the command with its output merged, in a user namespace with the ids 0 to 65535 and mounts of its own. As root,
/// they are the same ids as outside; for another account those that /etc/subuid and /etc/subgid grant it. If the
/// account has none, the status is not 0 and the output says what to install and to allow.
[[nodiscard]] ProgramResult runInMappedNamespace(const std::vector<std::string>& command);

}  // namespace adminhost::test
