#pragma once

// "bridge", the verb that "adminhostctl --host" runs on the other machine: it connects standard input and output with
// the daemon's socket there.

#include "adminhostctl/Verb.h"

#include <string_view>

namespace adminhost::ctl {

/// What the bridge writes first. So the other side knows that the login has ended, and no password is asked any more.
/// Bridges of earlier releases do not write it.
inline constexpr std::string_view bridgeBegin = "adminhostctl bridge begins\n";
/// What the bridge writes once it is connected, before anything of the daemon. The other side waits for it, and ignores
/// what start files of the shell there print.
inline constexpr std::string_view bridgeGreeting = "adminhostctl bridge\n";

/// Carries bytes in both directions until the daemon has closed the connection, or nobody reads standard output any
/// more. The end of standard input ends the sending half of the connection only. Throws Failure if the daemon cannot be
/// reached; then it has written bridgeBegin only.
[[nodiscard]] ExitStatus bridge(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
