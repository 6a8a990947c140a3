#pragma once

// The verbs that serve every plug-in: what the daemon runs, its commands and their help, who the directory knows.

#include "adminhostctl/Verb.h"

#include <span>

namespace adminhost::ctl {

[[nodiscard]] std::span<const Verb> generalVerbs() noexcept;

}  // namespace adminhost::ctl
