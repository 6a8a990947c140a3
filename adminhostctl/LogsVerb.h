#pragma once

// "logs": the service's log files, which the plug-ins name and the daemon reads.

#include "adminhostctl/Verb.h"

#include <span>
#include <string>
#include <string_view>

namespace adminhost::ctl {

inline constexpr std::string_view followOption = "--follow";
inline constexpr std::string_view linesOption = "--lines";

/// Lists the logs, or prints the last lines of one or all of them and, with the option, what is written from then on.
[[nodiscard]] ExitStatus logs(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
