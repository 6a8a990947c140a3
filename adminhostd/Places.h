#pragma once

// What the daemon finds on this machine: its plug-ins, its group, its directories.

#include "adminhostd/Options.h"
#include "adminhostd/Protocol.h"

#include <string>
#include <vector>

#include <sys/types.h>

namespace adminhost {

struct PluginSelection {
    std::vector<DiskPath> files;
    std::vector<protocol::RefusedPlugin> refused;  ///< not trustworthy, or not readable
};

/// The plug-ins to load: those that were named (refused only when everybody may write them), else the plug-in
/// directory's, which must be trustworthy as a whole.
[[nodiscard]] PluginSelection selectPlugins(const Options& options);

/// The socket's path on disk. The run directory is made when the socket is to lie there and it is missing.
[[nodiscard]] std::string socketPath(const Options& options);

/// The group's number; the daemon's own for an empty name. Throws std::runtime_error for an unknown group.
[[nodiscard]] gid_t groupOf(const std::string& name);

/// Where private directories are made: the run directory, or the system's place for temporary files beside an explicit
/// socket.
[[nodiscard]] std::string privateParent(const Options& options);

/// Looks at everything that the daemon needs and prints what is wrong, with its mend. Answers the exit status.
[[nodiscard]] int check(const Options& options);

/// What every worker is told first.
[[nodiscard]] protocol::Configure workerConfiguration(const Options& options, const PluginSelection& plugins,
                                                      const std::string& toolConfiguration);

}  // namespace adminhost
