#pragma once

// "bridge", the verb that "adminhostctl --host" runs on the other machine: it connects standard input and output with
// the daemon's socket there.

#include "adminhostctl/Verb.h"

#include <string_view>

namespace adminhost::ctl {

/// What the bridge writes once it is connected, before anything of the daemon. The other side waits for it, so that it
/// knows when the login has ended and can ignore what start files of the shell there print.
inline constexpr std::string_view bridgeGreeting = "adminhostctl bridge\n";

/// Carries bytes in both directions until the daemon has closed the connection, or nobody reads standard output any
/// more. The end of standard input ends the sending half of the connection only. Throws Failure if the daemon cannot be
/// reached; then nothing has been written.
[[nodiscard]] ExitStatus bridge(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
