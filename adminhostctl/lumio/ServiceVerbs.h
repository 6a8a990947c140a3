#pragma once

// The verbs for the service as a whole: its state, start and stop, its grid account.

#include "adminhostctl/Verb.h"

#include <span>

namespace adminhost::ctl {

[[nodiscard]] std::span<const Verb> serviceVerbs() noexcept;
[[nodiscard]] std::span<const VerbOption> serviceOptions() noexcept;

}  // namespace adminhost::ctl
