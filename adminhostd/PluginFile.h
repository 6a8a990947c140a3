#pragma once

// Plug-in files: whether they can be trusted, for which interface they are built, and loading them.

#include "platform/files/Path.h"
#include "platform/framework/Plugin.h"

#include <optional>
#include <string>
#include <vector>

namespace adminhost {

/// Returns why the directory or file is not trusted, with a suggested fix: it must belong to root (or to the daemon's
/// own account) and must not be writable by group or others. nullopt if it is trusted.
[[nodiscard]] std::optional<std::string> distrust(const DiskPath& path);

/// The same for a plug-in or configuration that the configuration or the command line names: the machine's daemon,
/// which was started by root without another system root, trusts it by the same rule. Elsewhere it may belong to
/// another account and be writable by a group, but not by everybody. nullopt if the file does not exist, which its
/// reader reports.
[[nodiscard]] std::optional<std::string> distrustNamed(const DiskPath& path);

/// The plug-ins (*.so) of a directory in the order of their names; nullopt, with errno, if it cannot be read.
[[nodiscard]] std::optional<std::vector<DiskPath>> pluginsIn(const DiskPath& directory);

/// The build identity in the file's note, read without running any of its code. The error names the file: it is not a
/// shared object for a 64-bit machine of this kind, it is truncated, or it has no note.
[[nodiscard]] Result<std::string> buildIdentityOf(const DiskPath& file);

struct LoadedPlugin {
    Plugin* plugin = nullptr;  ///< valid until the process ends
    std::string name;
    std::string version;
    std::vector<Command> commands;
};

/// Loads a plug-in whose note has this build's identity, and asks it for its name, version and commands. The error's
/// description names the file, what is wrong and the fix: the note is a different one, the file cannot be loaded or has
/// no entry point, or name or commands cannot be used in addresses. A loaded file stays loaded, also after an error.
[[nodiscard]] Result<LoadedPlugin> loadPlugin(const DiskPath& file);

}  // namespace adminhost
