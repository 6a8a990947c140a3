#pragma once

// A server that a test runs on a loopback port: its process, and the port.

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

namespace support {

/// A child process that is killed with the test, also if that crashes.
class ServerProcess {
  public:
    ServerProcess() = default;
    ServerProcess(const ServerProcess&) = delete;
    ServerProcess& operator=(const ServerProcess&) = delete;
    ~ServerProcess() { stop(); }

    /// Runs the program with empty input and its output in the file, and waits until the port accepts connections.
    /// Returns false, with the process ended, if it exits first: another program may have got the port.
    [[nodiscard]] bool start(const std::vector<std::string>& arguments, const std::filesystem::path& output, int port);
    /// Kills it.
    void stop() noexcept;
    [[nodiscard]] bool isRunning() const noexcept { return _pid > 0; }
    [[nodiscard]] pid_t pid() const noexcept { return _pid; }

  private:
    pid_t _pid = 0;
};

/// A loopback port that is free for TCP and UDP at the moment.
[[nodiscard]] int freePort();
/// Returns true if the loopback port accepts connections.
[[nodiscard]] bool accepts(int port);

/// Creates a directory below the one for temporary files; the name begins with the text.
[[nodiscard]] std::filesystem::path createTemporaryDirectory(std::string_view name);
[[nodiscard]] std::string contentsOf(const std::filesystem::path& path);
/// Writes a file; throws std::runtime_error if that fails.
void writeFile(const std::filesystem::path& path, std::string_view text);

}  // namespace support
