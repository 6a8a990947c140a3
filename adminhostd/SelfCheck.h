#pragma once

// adminhostd --check: finds everything that would keep the daemon from working here.

#include "adminhostd/Options.h"

namespace adminhost {

/// Checks everything that the daemon needs and prints each problem with a suggested fix. Returns the exit status.
[[nodiscard]] int check(const Options& options);

}  // namespace adminhost
