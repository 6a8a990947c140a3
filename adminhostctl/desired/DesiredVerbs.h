#pragma once

// The verbs of the desired state: reading and writing settings, the file of a whole state, the history.

#include "adminhostctl/Verb.h"

#include <span>

namespace adminhost::ctl {

[[nodiscard]] std::span<const Verb> desiredVerbs() noexcept;
[[nodiscard]] std::span<const VerbOption> desiredOptions() noexcept;

}  // namespace adminhost::ctl
