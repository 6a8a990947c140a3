#pragma once

#include "platform/files/FileDescriptor.h"

#include <string>

namespace adminhost {

/// A datagram socket that is connected to the Unix socket at the path; closed, with errno, if that fails.
[[nodiscard]] FileDescriptor datagramSocketTo(const std::string& path);

}  // namespace adminhost
