#pragma once

// The front's side of a worker: the process, which the monitor starts and ends, and the buffered conversation with it,
// which never blocks.

#include "adminhostd/Frame.h"
#include "adminhostd/MonitorLink.h"
#include "platform/files/FileDescriptor.h"

#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include <poll.h>
#include <sys/types.h>

namespace adminhost {

class WorkerProcess {
  public:
    enum class Purpose { serve, tryDirectory };

    /// Asks the monitor for a worker, which gets its configuration from the monitor. What is sent to it meanwhile is
    /// kept. Returns null, with errno, if the monitor cannot be asked. The link must outlive the object.
    [[nodiscard]] static std::unique_ptr<WorkerProcess> start(MonitorLink& monitor, Purpose purpose = Purpose::serve);

    WorkerProcess(const WorkerProcess&) = delete;
    WorkerProcess& operator=(const WorkerProcess&) = delete;
    /// A worker that is still running is killed.
    ~WorkerProcess();

    /// The process; nullopt before the monitor has started it.
    [[nodiscard]] std::optional<pid_t> pid() const noexcept { return _pid; }
    /// The worker of an earlier front whose end the monitor waits for before it starts this one.
    [[nodiscard]] std::optional<pid_t> waitsFor() const noexcept { return _waitsFor; }
    void addTo(std::vector<pollfd>& entries) const;

    /// After a poll of these entries: returns true if converse() has something to do.
    [[nodiscard]] bool mayConverse(std::span<const pollfd> polled) const noexcept;

    /// Queues a frame and sends what can be sent. Returns false if it is too large.
    [[nodiscard]] bool send(const Frame& frame);
    /// Writes what can be written without waiting, and reads once. Returns true if there may be more to read, after the
    /// frames that have arrived were taken by next().
    bool converse();
    /// The next frame that has arrived.
    [[nodiscard]] std::optional<Frame> next() { return _reader.next(); }
    /// Returns true if the worker has sent bytes that are not a frame.
    [[nodiscard]] bool broken() const noexcept { return _reader.broken(); }
    /// How the process ended ("was killed by signal 11 (Segmentation fault)"), or why it could not be started; nullopt
    /// while it is running. The monitor has ended the tools that it ran, but not a service that they have started.
    [[nodiscard]] const std::optional<std::string>& ending();
    void kill() noexcept;

  private:
    explicit WorkerProcess(MonitorLink& monitor) : _monitor(monitor) {}
    void receive(ReceivedMessage& received);
    void write();

    MonitorLink& _monitor;
    std::uint32_t _number = 0;
    std::optional<pid_t> _pid;
    std::optional<pid_t> _waitsFor;
    FileDescriptor _socket;
    FileDescriptor _process;  ///< needed once the monitor has ended
    FrameReader _reader;
    std::string _unsent;
    std::size_t _sent = 0;  ///< how much of it has been sent
    bool _closed = false;
    std::optional<std::string> _ending;
};

}  // namespace adminhost
