#pragma once

// The front's side of a worker: the child process and the buffered conversation with it, which never blocks.

#include "adminhostd/Frame.h"
#include "platform/files/FileDescriptor.h"
#include "platform/task/ToolRegister.h"

#include <memory>
#include <optional>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include <poll.h>
#include <sys/types.h>

namespace adminhost {

class WorkerProcess {
  public:
    /// Starts a worker. Operations print to its standard output, which is ours (a service manager keeps it), or our
    /// standard error if the log goes there. Returns null, with errno, if it cannot be started.
    [[nodiscard]] static std::unique_ptr<WorkerProcess> start(bool outputToStandardError);

    WorkerProcess(const WorkerProcess&) = delete;
    WorkerProcess& operator=(const WorkerProcess&) = delete;
    /// A worker that is still running is killed. One that the kernel cannot end yet (a dead mount) is left to the next
    /// parent.
    ~WorkerProcess();

    [[nodiscard]] pid_t pid() const noexcept { return _pid; }
    /// Adds the descriptors to poll: first the conversation, then the end of the process.
    void addTo(std::vector<pollfd>& entries) const;

    /// After a poll of these entries: returns true if converse() has something to do, or if the process may have ended.
    [[nodiscard]] bool mayConverse(std::span<const pollfd> polled) const noexcept;
    [[nodiscard]] bool mayHaveEnded(std::span<const pollfd> polled) const noexcept;

    /// Queues a frame and sends what can be sent. Returns false if it is too large.
    [[nodiscard]] bool send(const Frame& frame);
    /// Reads and writes what can be done without waiting, up to a bound. Returns true when the bound ended it: call
    /// again.
    bool converse();
    /// The next frame that has arrived.
    [[nodiscard]] std::optional<Frame> next() { return _reader.next(); }
    /// Returns true if the worker has sent bytes that are not a frame.
    [[nodiscard]] bool broken() const noexcept { return _reader.broken(); }
    /// How the process ended ("was killed by signal 11 (Segmentation fault)"); nullopt while it is running. Ends the
    /// tools that it ran, but not a service that they have started.
    [[nodiscard]] const std::optional<std::string>& ending();
    void kill() noexcept;
    /// Makes the worker end by closing the conversation, and waits for it, at most for the milliseconds.
    void finish(int milliseconds);

  private:
    explicit WorkerProcess(ToolRegister tools) : _tools(std::move(tools)) {}
    void write();

    pid_t _pid = -1;
    ToolRegister _tools;  ///< that the worker runs
    FileDescriptor _socket;
    FileDescriptor _process;
    FrameReader _reader;
    std::string _unsent;
    std::size_t _sent = 0;  ///< how much of it has been sent
    bool _closed = false;
    std::optional<std::string> _ending;
};

}  // namespace adminhost
