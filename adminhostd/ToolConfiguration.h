#pragma once

// Settings for the tools that the worker runs.

#include "platform/files/FileDescriptor.h"

#include <string>

namespace adminhost {

/// The directory that XDG_CONFIG_HOME names for the tools: a private one, made in the given directory, that holds the
/// database tool's start file. It lets releases that refuse double-quoted text accept it, and stands in for a start
/// file of the account, which could change what the tool prints. Removed with its owner.
class ToolConfiguration {
  public:
    /// Throws std::system_error when the directory cannot be made.
    explicit ToolConfiguration(const std::string& parent);
    ToolConfiguration(const ToolConfiguration&) = delete;
    ToolConfiguration& operator=(const ToolConfiguration&) = delete;
    ~ToolConfiguration();

    [[nodiscard]] const std::string& directory() const noexcept { return _directory; }

  private:
    std::string _directory;
    FileDescriptor _held;
};

}  // namespace adminhost
