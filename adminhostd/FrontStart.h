#pragma once

// How the monitor hands the front what it needs, besides the command line.

namespace adminhost {

constexpr int frontLink = 3;      ///< the front's descriptor of its conversation with the monitor
constexpr int frontListener = 4;  ///< its descriptor of the listening socket

/// The variable that names the private directory of the tools' configuration files. Workers do not get it.
constexpr const char* toolDirectoryVariable = "ADMINHOST_TOOL_DIRECTORY";

/// The exit status of a front that ends because of an error after it has started to serve; the monitor starts the next
/// one. With any other status before that, the daemon cannot be started.
constexpr int frontFailed = 3;

}  // namespace adminhost
