#pragma once

// The messages between monitor and front: four of one fixed size over a socket pair that keeps their boundaries.
//
//     start   front -> monitor: start a worker under this number; if `status` is 1, one that only tries the nodes of
//             the directory. What it loads, and where, is the monitor's to say: it sends the worker its configuration.
//             monitor -> front: it runs as `process`, and two descriptors come along: the conversation with the worker,
//             and a pidfd of it. If `status` is not 0, it does not run: EBUSY while the monitor waits for the end of
//             `process`, a worker of an earlier front, after which another "start" follows; any other number of the
//             system is why it cannot be started.
//     kill    front -> monitor: kill the worker and the tools that it runs.
//     configuration  monitor -> front: the configuration has been read again, and a descriptor of its copy comes along
//             (ConfigurationCopy.h). If `status` is 1, workers that have been started before have an old one.
//     ended   monitor -> front: the worker has ended with this status of wait(), and its tools have been killed.
//
// The monitor runs as the superuser and reads nothing else from the front, whose memory holds the bytes of strangers.

#include "platform/files/FileDescriptor.h"

#include <array>
#include <cstdint>
#include <optional>
#include <span>

namespace adminhost {

struct MonitorMessage {
    enum class Kind : std::uint32_t { start = 1, kill, ended, configuration };

    Kind kind = Kind::start;
    std::uint32_t worker = 0;  ///< the number by which the front calls it
    std::int32_t process = 0;
    std::int32_t status = 0;
};

/// Two connected descriptors, close-on-exec. Throws std::system_error.
[[nodiscard]] std::array<FileDescriptor, 2> monitorSocketPair();

/// Sends a message with descriptors, at most two, which stay open here. Returns false, with errno, if it was not sent.
[[nodiscard]] bool sendMonitorMessage(int socket, const MonitorMessage& message, std::span<const int> descriptors = {});

struct ReceivedMessage {
    enum class Kind { message, none, closed, malformed };

    Kind kind = Kind::none;
    MonitorMessage message = {};
    std::array<FileDescriptor, 2> descriptors = {};
};

/// Does not wait. A message of another size, of an unknown kind, or with more descriptors than fit is
/// malformed, and so is a conversation of which the other process has closed one direction only.
[[nodiscard]] ReceivedMessage receiveMonitorMessage(int socket);

}  // namespace adminhost
