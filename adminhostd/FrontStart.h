#pragma once

// How the monitor hands the front what it needs, besides the command line. All are descriptors.

namespace adminhost {

constexpr int frontLink = 3;      ///< the front's conversation with the monitor
constexpr int frontListener = 4;  ///< the listening socket

// Copies of the configuration (ConfigurationCopy.h).
constexpr int frontFirstConfiguration = 5;  ///< with which the daemon was started
constexpr int frontConfiguration = 6;       ///< that was read last

}  // namespace adminhost
