#pragma once

#include "platform/files/FileDescriptor.h"

#include <cstdint>
#include <optional>

namespace adminhost {

/// The resident memory of this process. Opens its file at once, so that it can also be read when files can no longer
/// be opened.
class OwnMemory {
  public:
    OwnMemory() noexcept;
    /// Returns nullopt if the system does not tell.
    [[nodiscard]] std::optional<std::uint64_t> bytes() const noexcept;

  private:
    FileDescriptor _file;
};

}  // namespace adminhost
