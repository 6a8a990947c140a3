#pragma once

// Standard input, output and error of a process that was started without them.

#include "platform/framework/Export.h"

namespace adminhost {

/// Opens /dev/null on those of the descriptors 0 to 2 that are closed. Every program calls this first: the next file or
/// socket that it opens would otherwise become its standard input or output, and be read from or written to by mistake.
/// Returns false when /dev/null cannot be opened; then the program must not go on.
[[nodiscard]] ADMINHOST_EXPORT bool openStandardDescriptors() noexcept;

}  // namespace adminhost
