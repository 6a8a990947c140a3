#pragma once

// Configuration files for the tools that plug-ins run.

#include "platform/files/FileDescriptor.h"
#include "platform/framework/Plugin.h"
#include "platform/value/Error.h"

#include <optional>
#include <string>
#include <vector>

namespace adminhost {

/// The variable that names the directory for the tools. Each plug-in's tools get a subdirectory of it.
constexpr const char* toolConfigurationVariable = "XDG_CONFIG_HOME";

/// A directory below the given one that only this process's account can write and list, used in place of an account's
/// own: files of an account could change the output of tools. Removed with this object.
class ToolConfiguration {
  public:
    /// Throws std::system_error if the directory cannot be created.
    explicit ToolConfiguration(const std::string& parent);
    ToolConfiguration(const ToolConfiguration&) = delete;
    ToolConfiguration& operator=(const ToolConfiguration&) = delete;
    ~ToolConfiguration();

    [[nodiscard]] const std::string& directory() const noexcept { return _directory; }

  private:
    std::string _directory;
    FileDescriptor _held;
};

/// Creates the directory and writes the files in it, replacing those of an earlier worker. Every account can read them,
/// because a tool may run as another account. Fails if a path is not below
/// the directory, or cannot be written.
[[nodiscard]] Result<void> writeToolFiles(const std::string& directory, const std::vector<ToolFile>& files);

}  // namespace adminhost
