#pragma once

// How the monitor hands the front what it needs, besides the command line.

namespace adminhost {

constexpr int frontLink = 3;      ///< the front's descriptor of its conversation with the monitor
constexpr int frontListener = 4;  ///< its descriptor of the listening socket

/// The variable that names the private directory of the tools' configuration files. Workers do not get it.
constexpr const char* toolDirectoryVariable = "ADMINHOST_TOOL_DIRECTORY";

}  // namespace adminhost
