#pragma once

// The verbs of this one service: its cameras and its workflow properties.

#include "adminhostctl/Verb.h"

#include <span>

namespace adminhost::ctl {

[[nodiscard]] std::span<const Verb> lumioVerbs() noexcept;
[[nodiscard]] std::span<const VerbOption> lumioOptions() noexcept;

}  // namespace adminhost::ctl
