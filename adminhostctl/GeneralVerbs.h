#pragma once

// The verbs that serve every plug-in: the daemon's status, its commands and their help, look-ups in the directory.

#include "adminhostctl/Verb.h"

#include <span>

namespace adminhost::ctl {

[[nodiscard]] std::span<const Verb> generalVerbs() noexcept;
[[nodiscard]] std::span<const VerbOption> generalOptions() noexcept;

}  // namespace adminhost::ctl
