#pragma once

// The daemon of this build, run by a test: started with its socket and its temporary files in a directory of its own,
// ended and removed with the object. A failure to start throws std::runtime_error.

#include "tests/support/UnixHttp.h"

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

namespace adminhost::test {

class DaemonProcess {
  public:
    struct Options {
        /// Beside --socket, --config, --log stderr and, if there is none, a --root of its own.
        std::vector<std::string> arguments = {};
        std::string configuration = {};             ///< text of the configuration file
        std::vector<std::string> environment = {};  ///< "NAME=value", beside the test's own
        bool waitUntilReady = true;                 ///< until it answers its first request
        std::string socket = {};                    ///< where to listen, instead of in the directory
        unsigned descriptors = 0;                   ///< how many it may have open (ulimit -n); 0: the test's own bound
        int standardError = -1;                     ///< where its log goes, instead of to a file
        std::string program = {};                   ///< another place of the daemon's program
    };

    explicit DaemonProcess(const Options& options);
    DaemonProcess(const DaemonProcess&) = delete;
    DaemonProcess& operator=(const DaemonProcess&) = delete;
    /// Kills it if it is still running.
    ~DaemonProcess();

    /// The process id of the monitor.
    [[nodiscard]] pid_t pid() const noexcept { return _pid; }
    /// The process id of the front; -1 while none is running.
    [[nodiscard]] pid_t frontPid() const;
    [[nodiscard]] const std::filesystem::path& directory() const noexcept { return _directory; }
    [[nodiscard]] const std::string& socket() const noexcept { return _socket; }
    [[nodiscard]] UnixHttp connect() const { return UnixHttp(socket()); }

    /// The process id of the worker, as the daemon reports it. Waits for a worker that is being started, and returns -1
    /// if there is none after 30 seconds.
    [[nodiscard]] pid_t workerPid() const;
    /// Its output on standard error: the log.
    [[nodiscard]] std::string log() const;
    /// Waits until the log contains the text. Returns false after 30 seconds.
    [[nodiscard]] bool waitForLog(const std::string& text) const;
    /// Waits until that many requests wait for the running one to end. Returns false after 30 seconds.
    [[nodiscard]] bool waitForWaiting(unsigned count) const;

    void signal(int number) const;
    /// Waits for its end. Returns the exit status, 128 + number if a signal ended it, nullopt if it does not end in
    /// time.
    std::optional<int> wait(std::chrono::milliseconds bound = std::chrono::seconds(20));

  private:
    void end();

    std::filesystem::path _directory;
    std::string _socket;
    pid_t _pid = -1;
    std::optional<int> _status;
};

/// Returns false for a process that has ended, also if nobody has collected its status.
[[nodiscard]] bool isRunning(pid_t process);
/// The processes that the process's first thread has started and that have not been reaped.
[[nodiscard]] std::vector<pid_t> childrenOf(pid_t process);
/// Open descriptors of a process. Always 0 for a daemon if the test does not run as root.
[[nodiscard]] std::size_t descriptorsOf(pid_t pid);
/// Resident memory of a process in kilobytes.
[[nodiscard]] std::size_t residentKilobytesOf(pid_t pid);

}  // namespace adminhost::test
