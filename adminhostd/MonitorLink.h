#pragma once

// The front's end of its conversation with the monitor, which starts and ends the workers for it.

#include "adminhostd/MonitorMessage.h"
#include "platform/files/FileDescriptor.h"

#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <span>
#include <utility>
#include <vector>

#include <poll.h>

namespace adminhost {

class MonitorLink {
  public:
    /// Receives what the monitor sends about one worker.
    using Receiver = std::function<void(ReceivedMessage&)>;

    explicit MonitorLink(FileDescriptor socket) : _socket(std::move(socket)) {}
    MonitorLink(const MonitorLink&) = delete;
    MonitorLink& operator=(const MonitorLink&) = delete;

    /// Asks for a worker, or for one that only tries the directory's nodes, and returns its number; 0, with errno, if
    /// the monitor cannot be asked. The receiver is called by run() until forget().
    [[nodiscard]] std::uint32_t start(bool triesNodes, Receiver receiver);
    /// Has the worker and its tools killed. Without a monitor, nothing can be killed: the worker ends by itself.
    void kill(std::uint32_t worker) noexcept;
    void forget(std::uint32_t worker) noexcept { _receivers.erase(worker); }

    struct Configuration {
        FileDescriptor copy;   ///< of what the monitor has read (ConfigurationCopy.h)
        bool isNewForWorkers;  ///< those that have been started before have an old one
    };
    /// The latest configuration that has arrived since the last call; nullopt if there is none.
    [[nodiscard]] std::optional<Configuration> takeConfiguration() {
        return std::exchange(_configuration, std::nullopt);
    }

    /// Returns true if the monitor has ended. No worker can be started any more.
    [[nodiscard]] bool closed() const noexcept { return !_socket.isOpen(); }

    void addTo(std::vector<pollfd>& entries) const { entries.push_back({_socket.get(), POLLIN, 0}); }
    /// Passes on everything that has arrived, if the poll of these entries has found something. Does not wait.
    void run(std::span<const pollfd> polled);

  private:
    FileDescriptor _socket;
    std::map<std::uint32_t, Receiver> _receivers;
    std::uint32_t _last = 0;
    std::optional<Configuration> _configuration;
};

}  // namespace adminhost
