// The daemon's own share of a request: against a bare echo over a Unix socket, through the worker, at start, in memory.
// Compared programs are timed in turn in one run, so that disturbances on the machine affect both equally.

#include "bench/HostClient.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Program.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include <benchmark/benchmark.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace bench;
using adminhost::test::DaemonProcess;
using adminhost::test::residentKilobytesOf;
using Clock = std::chrono::steady_clock;

/// A minimal client, so that the server is measured and not the client.
class Client {
  public:
    explicit Client(const std::string& path) : _socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0)) {
        const sockaddr_un address = addressOf(path);
        if (::connect(_socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
            throw std::runtime_error("cannot connect to " + path);
        }
    }
    Client(const Client&) = delete;
    Client& operator=(const Client&) = delete;
    ~Client() { ::close(_socket); }

    /// Sends the text, reads one HTTP answer and returns its size.
    std::size_t exchange(std::string_view request) {
        if (::send(_socket, request.data(), request.size(), MSG_NOSIGNAL) != static_cast<ssize_t>(request.size())) {
            throw std::runtime_error("cannot send");
        }
        std::size_t have = 0;
        for (;;) {
            const ssize_t count = ::recv(_socket, _buffer + have, sizeof _buffer - have, 0);
            if (count <= 0) {
                throw std::runtime_error("no answer");
            }
            have += static_cast<std::size_t>(count);
            const std::string_view text(_buffer, have);
            const std::size_t head = text.find("\r\n\r\n");
            if (head == std::string_view::npos) {
                continue;
            }
            const std::size_t length = text.find("Content-Length: ");
            const std::size_t body = length < head ? std::strtoul(_buffer + length + 16, nullptr, 10) : 0;
            if (have >= head + 4 + body) {
                return have;
            }
        }
    }

  private:
    int _socket;
    char _buffer[16 << 10];
};

/// A process that accepts one connection at a time and sends an answer of this size for everything that it reads.
class EchoServer {
  public:
    EchoServer(std::string path, std::size_t size) : _path(std::move(path)) {
        const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        const sockaddr_un address = addressOf(_path);
        ::unlink(_path.c_str());
        if (::bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
            ::listen(listener, 16) != 0) {
            throw std::runtime_error("cannot listen at " + _path);
        }
        const std::string head = "HTTP/1.1 200 OK\r\n\r\n";
        const std::string answer = "HTTP/1.1 200 OK\r\nX: " + std::string(size - head.size() - 5, 'x') + "\r\n\r\n";
        _child = ::fork();
        if (_child == 0) {
            for (;;) {
                const int client = ::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
                char buffer[4096];
                while (::recv(client, buffer, sizeof buffer, 0) > 0 &&
                       ::send(client, answer.data(), answer.size(), MSG_NOSIGNAL) > 0) {
                }
                ::close(client);
            }
        }
        ::close(listener);
    }
    EchoServer(const EchoServer&) = delete;
    EchoServer& operator=(const EchoServer&) = delete;
    ~EchoServer() {
        ::kill(_child, SIGKILL);
        ::waitpid(_child, nullptr, 0);
    }

  private:
    std::string _path;
    pid_t _child = -1;
};

/// The overview, with a connection of its own or on a kept one, against an echo of as many bytes.
void overview(benchmark::State& state, bool kept) {
    const DaemonProcess daemon(fixture());
    const std::string echoPath = (daemon.directory() / "echo").string();
    const std::size_t size = Client(daemon.socket()).exchange(overviewRequest);
    const EchoServer echo(echoPath, size);
    Client keptDaemon(daemon.socket());
    std::vector<double> ours;
    std::vector<double> floor;
    if (kept) {
        Client keptEcho(echoPath);
        while (state.KeepRunning()) {
            floor.push_back(microsecondsOf([&] { keptEcho.exchange(overviewRequest); }));
            ours.push_back(microsecondsOf([&] { keptDaemon.exchange(overviewRequest); }));
        }
    } else {
        while (state.KeepRunning()) {
            floor.push_back(microsecondsOf([&] { Client(echoPath).exchange(overviewRequest); }));
            ours.push_back(microsecondsOf([&] { Client(daemon.socket()).exchange(overviewRequest); }));
        }
    }
    state.counters["p50_us"] = quantile(ours, 0.5);
    state.counters["p99_us"] = quantile(ours, 0.99);
    state.counters["p50_ratio"] = quantile(ours, 0.5) / quantile(floor, 0.5);
    state.counters["p99_ratio"] = quantile(ours, 0.99) / quantile(floor, 0.99);
}
BENCHMARK_CAPTURE(overview, own_connection, false)->Iterations(20'000)->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(overview, kept_connection, true)->Iterations(20'000)->Unit(benchmark::kMicrosecond);

/// An operation that does nothing, on a kept connection: client, front, worker and back.
void nothingThroughTheWorker(benchmark::State& state) {
    const DaemonProcess daemon(fixture());
    Client client(daemon.socket());
    std::vector<double> times;
    while (state.KeepRunning()) {
        times.push_back(microsecondsOf([&] { client.exchange(nothingRequest); }));
    }
    state.counters["p50_us"] = quantile(times, 0.5);
    state.counters["p99_us"] = quantile(times, 0.99);
}
BENCHMARK(nothingThroughTheWorker)->Iterations(20'000)->Unit(benchmark::kMicrosecond);

/// One start of the daemon's program that does nothing else than print its version.
double millisecondsOfABareStart() {
    const auto program = std::filesystem::read_symlink("/proc/self/exe").parent_path().parent_path() / "bin/adminhostd";
    const auto start = Clock::now();
    const auto run = adminhost::test::runProgram({program.string(), "--version"});
    if (run.status != 0) {
        throw std::runtime_error("cannot start " + program.string());
    }
    return std::chrono::duration<double, std::milli>(Clock::now() - start).count();
}

/// From the start of the program to its first answer, plug-in loaded and database tool tried. The floor is a bare start
/// of the same program.
void startToFirstAnswer(benchmark::State& state) {
    std::vector<double> times;
    std::vector<double> floor;
    while (state.KeepRunning()) {
        floor.push_back(millisecondsOfABareStart());
        auto options = fixture();
        options.waitUntilReady = false;
        const auto start = Clock::now();
        const DaemonProcess daemon(options);
        for (;;) {
            try {
                Client(daemon.socket()).exchange(overviewRequest);
                break;
            } catch (const std::runtime_error&) {
                ::usleep(200);  // the socket does not exist yet
            }
        }
        times.push_back(std::chrono::duration<double, std::milli>(Clock::now() - start).count());
    }
    state.counters["p50_ms"] = quantile(times, 0.5);
    state.counters["worst_ms"] = quantile(times, 1);
    state.counters["floor_ms"] = quantile(floor, 0.5);
    state.counters["p50_ratio"] = quantile(times, 0.5) / quantile(floor, 0.5);
}
BENCHMARK(startToFirstAnswer)->Iterations(30)->Unit(benchmark::kMillisecond);

/// Resident memory of front and worker together after 1,000 and after 10,000 operations.
void residentMemory(benchmark::State& state) {
    const DaemonProcess daemon(fixture());
    const pid_t worker = daemon.workerPid();
    const auto megabytes = [&] {
        return static_cast<double>(residentKilobytesOf(daemon.frontPid()) + residentKilobytesOf(worker)) / 1024;
    };
    Client client(daemon.socket());
    const auto serve = [&](int count) {
        for (int i = 0; i < count; ++i) {
            client.exchange(nothingRequest);
        }
    };
    while (state.KeepRunning()) {
        serve(1'000);
        state.counters["mb_after_1000"] = megabytes();
        serve(9'000);
        state.counters["mb_after_10000"] = megabytes();
        state.counters["mb_front"] = static_cast<double>(residentKilobytesOf(daemon.frontPid())) / 1024;
    }
}
BENCHMARK(residentMemory)->Iterations(1)->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
