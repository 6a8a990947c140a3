#pragma once

// Times a request on its whole way (client, socket, front, worker, plug-in, tools) against its floor: the same runs of
// the same tools by posix_spawn alone. Both are timed in turn in one run; "ratio" is the median of the requests divided
// by the median of the floors.

#include "bench/Alternating.h"
#include "tests/support/SampleRoot.h"

#include <array>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <sstream>
#include <stdexcept>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <fcntl.h>
#include <poll.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace bench {

using adminhost::test::SampleRoot;
using adminhost::test::SampleSizes;
using Command = std::vector<std::string>;

inline pid_t start(const Command& command, const posix_spawn_file_actions_t* actions) {
    std::vector<char*> arguments;
    for (const std::string& word : command) {
        arguments.push_back(const_cast<char*>(word.c_str()));
    }
    arguments.push_back(nullptr);
    pid_t child = 0;
    if (::posix_spawn(&child, arguments[0], actions, nullptr, arguments.data(), environ) != 0) {
        throw std::runtime_error("cannot start " + command[0]);
    }
    return child;
}

/// One bare run: captures both streams and waits for the child.
inline std::size_t run(const Command& command) {
    std::array<int, 2> out{};
    std::array<int, 2> err{};
    if (::pipe2(out.data(), O_CLOEXEC) != 0 || ::pipe2(err.data(), O_CLOEXEC) != 0) {
        throw std::runtime_error("no pipe");
    }
    posix_spawn_file_actions_t actions;
    ::posix_spawn_file_actions_init(&actions);
    ::posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
    ::posix_spawn_file_actions_adddup2(&actions, out[1], 1);
    ::posix_spawn_file_actions_adddup2(&actions, err[1], 2);
    const pid_t child = start(command, &actions);
    ::posix_spawn_file_actions_destroy(&actions);
    ::close(out[1]);
    ::close(err[1]);
    std::string captured;
    std::array<pollfd, 2> watched{{{out[0], POLLIN, 0}, {err[0], POLLIN, 0}}};
    std::array<char, 65536> buffer;
    for (int open = 2; open > 0;) {
        ::poll(watched.data(), watched.size(), -1);
        for (pollfd& one : watched) {
            if (one.fd < 0 || one.revents == 0) {
                continue;
            }
            const ssize_t count = ::read(one.fd, buffer.data(), buffer.size());
            if (count <= 0) {
                ::close(one.fd);
                one.fd = -1;
                --open;
            } else {
                captured.append(buffer.data(), static_cast<std::size_t>(count));
            }
        }
    }
    int status = 0;
    if (::waitpid(child, &status, 0) != child || status != 0) {
        throw std::runtime_error("failed: " + command.back() + ": " + captured);
    }
    return captured.size();
}

/// The daemon on a sample root. The destructor stops it.
class Daemon {
  public:
    explicit Daemon(const SampleRoot& root, const Command& options = {}) : _socket(root.directory() + "/s") {
        const auto build = std::filesystem::read_symlink("/proc/self/exe").parent_path().parent_path();
        posix_spawn_file_actions_t actions;
        ::posix_spawn_file_actions_init(&actions);
        const std::string log = root.directory() + "/log";
        ::posix_spawn_file_actions_addopen(&actions, 2, log.c_str(), O_WRONLY | O_CREAT, 0600);
        Command command{build / "bin/adminhostd",         "--root", root.path(), "--socket", _socket, "--plugin",
                        build / "lib/adminhost_lumio.so", "--log",  "stderr"};
        command.insert(command.end(), options.begin(), options.end());
        _process = start(command, &actions);
        ::posix_spawn_file_actions_destroy(&actions);
        for (int i = 0; i < 1000 && !std::filesystem::exists(_socket); ++i) {
            ::usleep(10'000);
        }
    }
    Daemon(const Daemon&) = delete;
    Daemon& operator=(const Daemon&) = delete;
    ~Daemon() {
        ::kill(_process, SIGTERM);
        ::waitpid(_process, nullptr, 0);
    }

    [[nodiscard]] pid_t process() const noexcept { return _process; }
    [[nodiscard]] const std::string& socket() const noexcept { return _socket; }

    /// Sends one request on a connection of its own and returns the whole answer.
    [[nodiscard]] std::string request(const std::string& command, const std::string& body) const {
        const int connection = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        std::strncpy(address.sun_path, _socket.c_str(), sizeof address.sun_path - 1);
        if (::connect(connection, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
            throw std::runtime_error("cannot connect");
        }
        const std::string text =
            "POST /v1/lumio/" + command +
            " HTTP/1.1\r\nHost: x\r\nConnection: close\r\nContent-Length: " + std::to_string(body.size()) + "\r\n\r\n" +
            body;
        std::string answer;
        if (::write(connection, text.data(), text.size()) == static_cast<ssize_t>(text.size())) {
            std::array<char, 65536> buffer;
            for (ssize_t count = 0; (count = ::read(connection, buffer.data(), buffer.size())) > 0;) {
                answer.append(buffer.data(), static_cast<std::size_t>(count));
            }
        }
        ::close(connection);
        if (!answer.starts_with("HTTP/1.1 200")) {
            throw std::runtime_error(answer.substr(0, 400));
        }
        return answer;
    }

  private:
    std::string _socket;
    pid_t _process = 0;
};

/// Times request and floor in turn.
template <class Floor>
void compare(benchmark::State& state, const std::string& command, const std::string& body, const Daemon& daemon,
             Floor floor) {
    const auto request = [&] { benchmark::DoNotOptimize(daemon.request(command, body)); };
    request();
    alternate(state, Clock::wall, request, floor, [] {});
}

/// The floor's tool runs, one after the other.
inline void runAll(const std::vector<Command>& tools) {
    for (const Command& tool : tools) {
        benchmark::DoNotOptimize(run(tool));
    }
}

inline Command query(const SampleRoot& root, const std::string& statement) {
    return {root.disk("/usr/bin/sqlite3"), "-line", root.databasePath(), statement};
}

}  // namespace bench
