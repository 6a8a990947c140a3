#pragma once

// The revision of the settings: a digest that changes when reading settings would show something else that a write can
// change.

#include <string>

namespace lumio {

/// Digest of the four settings files as they load and of the resources' columns that administrators change (the present
/// activity of cameras and jobs is not part of it). It guards administrators against each other: the service itself may
/// change its files and its database at any time, also between a comparison and the write that follows it.
[[nodiscard]] std::string settingsRevision();

}  // namespace lumio
