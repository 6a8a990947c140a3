#pragma once

// The verbs of this one service: its cameras, workflows and workflow properties.

#include "adminhostctl/Verb.h"

#include <span>

namespace adminhost::ctl {

[[nodiscard]] std::span<const Verb> lumioVerbs() noexcept;
[[nodiscard]] std::span<const VerbOption> lumioOptions() noexcept;

}  // namespace adminhost::ctl
