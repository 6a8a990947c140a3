#pragma once

// What an administrator should know about the service's installation before it fails: its tools, files and settings.

#include "platform/framework/Plugin.h"

#include <vector>

namespace lumio {

/// The checks, in the order in which people read them. Changes nothing, runs the database tool once, and none of the
/// service's own tools. The checks of the shared file system come last: they wait as long as that does.
[[nodiscard]] std::vector<adminhost::Diagnosis> installationChecks();

}  // namespace lumio
