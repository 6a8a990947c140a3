#pragma once

// The verbs of the desired state: reading and writing settings, the file of a whole state, the history.

#include "adminhostctl/Verb.h"

#include <span>
#include <string_view>

namespace adminhost::ctl {

/// The option for a file with a password; "-" asks, or reads standard input.
inline constexpr std::string_view passwordFileOption = "--password-file";

/// Verbs whose examples need names of a service have none: the service's own verbs come with them.
[[nodiscard]] std::span<const Verb> desiredVerbs() noexcept;
[[nodiscard]] std::span<const VerbOption> desiredOptions() noexcept;

}  // namespace adminhost::ctl
