#pragma once

// The configuration as the monitor hands it to the front.
//
// The monitor alone reads the file. What it has accepted goes to the front in sealed memory, which nobody can change
// any more: so both have the same settings, also if the file has been edited, broken or made unreadable for the front.

#include "platform/files/FileDescriptor.h"

#include <string>

namespace adminhost {

struct ConfigurationText {
    std::string path;  ///< on disk; empty without a configuration file
    std::string text;
};

/// Returns a close-on-exec descriptor of a copy. Throws std::system_error.
[[nodiscard]] FileDescriptor sealedCopyOf(const ConfigurationText& configuration);

/// Reads what sealedCopyOf() has written. Throws std::runtime_error if it cannot be read.
[[nodiscard]] ConfigurationText configurationIn(int copy);

}  // namespace adminhost
