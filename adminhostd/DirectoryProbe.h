#pragma once

// Logs the directory nodes that cannot be reached, after a worker's start.
//
// The nodes are tried by a process of its own, a worker that serves nothing: a server that does not respond delays
// neither the start nor a request, and whatever a library does while it connects, this process can be killed.

#include "adminhostd/WorkerProcess.h"

#include <chrono>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace adminhost {

class DirectoryProbe {
  public:
    /// Starts to try the nodes of the configuration. Does nothing if they are being tried already.
    void start(MonitorLink& monitor);

    void addTo(std::vector<pollfd>& entries) const;
    /// When run() has to be called at the latest.
    [[nodiscard]] std::optional<std::chrono::steady_clock::time_point> due() const;
    /// Does everything that needs no waiting, after a poll of these entries. Passes on the events for the log.
    void run(std::span<const pollfd> polled, const std::function<void(const std::string&)>& log);

  private:
    std::unique_ptr<WorkerProcess> _process;  ///< null while nothing is tried
    std::chrono::steady_clock::time_point _until;
};

}  // namespace adminhost
