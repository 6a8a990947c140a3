// The daemon under 1, 8 and 64 clients at once, against an echo server over epoll that sends as many bytes. One program
// is the client of all: each of its connections sends its next request when the answer to the last one has arrived.
// Rounds of the compared servers take turns, so that disturbances on the machine affect both equally.
//
// "apart" keeps the client on the first processor and each server, with all of its processes, on the second one: then
// client and server wake a sleeping processor for each message, whichever server it is. Without it, the system places
// them, the echo server often on its client's processor and the front on the other one.

#include "bench/HostClient.h"
#include "tests/support/DaemonProcess.h"

#include <array>
#include <csignal>
#include <cstdlib>
#include <memory>
#include <stdexcept>
#include <string>
#include <string_view>
#include <vector>

#include <benchmark/benchmark.h>
#include <sched.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using adminhost::test::DaemonProcess;
using Clock = std::chrono::steady_clock;

constexpr int eventMaximum = 64;

int connected(const std::string& path) {
    const int socket = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    const sockaddr_un address = bench::addressOf(path);
    if (::connect(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        throw std::runtime_error("cannot connect to " + path);
    }
    return socket;
}

/// Adds a descriptor to those that epoll watches, under its place in the list of its owner.
void watch(int epoll, int descriptor, std::size_t place) {
    epoll_event event{};
    event.events = EPOLLIN;
    event.data.u64 = place;
    if (::epoll_ctl(epoll, EPOLL_CTL_ADD, descriptor, &event) != 0) {
        throw std::runtime_error("cannot watch a connection");
    }
}

/// The connections of several clients, served by one thread.
class Clients {
  public:
    Clients(const std::string& path, std::size_t count, std::string_view request)
        : _request(request), _epoll(::epoll_create1(EPOLL_CLOEXEC)), _connections(count) {
        for (std::size_t i = 0; i < count; ++i) {
            _connections[i].socket = connected(path);
            watch(_epoll, _connections[i].socket, i);
        }
    }
    Clients(const Clients&) = delete;
    Clients& operator=(const Clients&) = delete;
    ~Clients() {
        for (const Connection& connection : _connections) {
            ::close(connection.socket);
        }
        ::close(_epoll);
    }

    /// Has every client make so many requests; adds the time of each to the list, in microseconds.
    void exchange(int requests, std::vector<double>& times) {
        std::size_t busy = _connections.size();
        for (Connection& connection : _connections) {
            connection.left = requests;
            send(connection);
        }
        std::array<epoll_event, eventMaximum> events{};
        while (busy > 0) {
            const int count = ::epoll_wait(_epoll, events.data(), eventMaximum, 10'000);
            if (count <= 0) {
                throw std::runtime_error("no answer within ten seconds");
            }
            for (int i = 0; i < count; ++i) {
                Connection& connection = _connections[events[static_cast<std::size_t>(i)].data.u64];
                if (!receive(connection)) {
                    continue;
                }
                times.push_back(std::chrono::duration<double, std::micro>(Clock::now() - connection.sent).count());
                if (--connection.left > 0) {
                    send(connection);
                } else {
                    --busy;
                }
            }
        }
    }

    /// The bytes of the last answer of the first client.
    [[nodiscard]] std::string lastAnswer() const { return {_connections[0].buffer.data(), _connections[0].have}; }

  private:
    struct Connection {
        int socket = -1;
        int left = 0;
        std::size_t have = 0;
        Clock::time_point sent;
        std::array<char, 16 << 10> buffer;
    };

    void send(Connection& connection) const {
        connection.have = 0;
        connection.sent = Clock::now();
        if (::send(connection.socket, _request.data(), _request.size(), MSG_NOSIGNAL) !=
            static_cast<ssize_t>(_request.size())) {
            throw std::runtime_error("cannot send");
        }
    }

    /// Returns true once the whole answer is there. Throws for an answer that is not a success.
    static bool receive(Connection& connection) {
        const ssize_t count = ::recv(connection.socket, connection.buffer.data() + connection.have,
                                     connection.buffer.size() - connection.have, 0);
        if (count <= 0) {
            throw std::runtime_error("the connection was closed");
        }
        connection.have += static_cast<std::size_t>(count);
        const std::string_view text(connection.buffer.data(), connection.have);
        const std::size_t head = text.find("\r\n\r\n");
        if (head == std::string_view::npos) {
            return false;
        }
        if (!text.starts_with("HTTP/1.1 20")) {
            throw std::runtime_error("refused: " + std::string(text));
        }
        const std::size_t length = text.find("Content-Length: ");
        const std::size_t body = length < head ? std::strtoul(connection.buffer.data() + length + 16, nullptr, 10) : 0;
        return connection.have >= head + 4 + body;
    }

    std::string_view _request;
    int _epoll;
    std::vector<Connection> _connections;
};

/// A process that sends the answer for everything that it reads, on as many connections as there are.
class EpollEcho {
  public:
    EpollEcho(const std::string& path, const std::string& answer) {
        const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        const sockaddr_un address = bench::addressOf(path);
        ::unlink(path.c_str());
        if (::bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0 ||
            ::listen(listener, 128) != 0) {
            throw std::runtime_error("cannot listen at " + path);
        }
        _child = ::fork();
        if (_child == 0) {
            serve(listener, answer);
        }
        ::close(listener);
    }
    EpollEcho(const EpollEcho&) = delete;
    EpollEcho& operator=(const EpollEcho&) = delete;
    ~EpollEcho() {
        ::kill(_child, SIGKILL);
        ::waitpid(_child, nullptr, 0);
    }

  private:
    [[noreturn]] static void serve(int listener, const std::string& answer) {
        const int epoll = ::epoll_create1(EPOLL_CLOEXEC);
        watch(epoll, listener, static_cast<std::size_t>(listener));
        std::array<epoll_event, eventMaximum> events{};
        std::array<char, 4096> buffer;
        for (;;) {
            const int count = ::epoll_wait(epoll, events.data(), eventMaximum, -1);
            for (int i = 0; i < count; ++i) {
                const int ready = static_cast<int>(events[static_cast<std::size_t>(i)].data.u64);
                if (ready == listener) {
                    const int client = ::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
                    watch(epoll, client, static_cast<std::size_t>(client));
                } else if (::recv(ready, buffer.data(), buffer.size(), 0) <= 0 ||
                           ::send(ready, answer.data(), answer.size(), MSG_NOSIGNAL) < 0) {
                    ::close(ready);
                }
            }
        }
    }

    pid_t _child = -1;
};

/// Keeps this process, and those that it starts from now on, on one processor.
void stayOn(std::size_t processor) {
    cpu_set_t processors;
    CPU_ZERO(&processors);
    CPU_SET(processor, &processors);
    if (::sched_setaffinity(0, sizeof processors, &processors) != 0) {
        throw std::runtime_error("cannot be kept on one processor");
    }
}

/// Undoes stayOn() when the scope ends.
class ScopedPlacement {
  public:
    ScopedPlacement() { ::sched_getaffinity(0, sizeof _before, &_before); }
    ScopedPlacement(const ScopedPlacement&) = delete;
    ScopedPlacement& operator=(const ScopedPlacement&) = delete;
    ~ScopedPlacement() { ::sched_setaffinity(0, sizeof _before, &_before); }

  private:
    cpu_set_t _before{};
};

/// Each client sends so many requests in a round; a round is one iteration.
constexpr int requestsPerRound = 64;

void against(benchmark::State& state, std::string_view request) {
    const auto count = static_cast<std::size_t>(state.range(0));
    const bool apart = state.range(1) != 0;
    const ScopedPlacement placement;
    if (apart) {
        stayOn(1);
    }
    auto options = bench::fixture();
    options.configuration = "queue_limit = 256\n";
    const DaemonProcess daemon(options);
    std::vector<double> ours;
    std::vector<double> echo;
    Clients clients(daemon.socket(), count, request);
    clients.exchange(1, ours);
    const std::string path = (daemon.directory() / "echo").string();
    const EpollEcho server(path, clients.lastAnswer());
    if (apart) {
        stayOn(0);
    }
    Clients echoClients(path, count, request);
    clients.exchange(requestsPerRound, ours);  // warm
    echoClients.exchange(requestsPerRound, echo);
    ours.clear();
    echo.clear();
    double ourSeconds = 0;
    while (state.KeepRunning()) {
        echoClients.exchange(requestsPerRound, echo);
        ourSeconds += bench::microsecondsOf([&] { clients.exchange(requestsPerRound, ours); }) * 1e-6;
    }
    state.counters["requests_per_s"] = static_cast<double>(ours.size()) / ourSeconds;
    for (const auto& [name, share] : {std::pair("p50", 0.5), std::pair("p99", 0.99)}) {
        const double one = bench::quantile(ours, share);
        const double floor = bench::quantile(echo, share);
        state.counters[std::string(name) + "_us"] = one;
        state.counters["echo_" + std::string(name) + "_us"] = floor;
        state.counters[std::string(name) + "_ratio"] = one / floor;
    }
}

void overview(benchmark::State& state) {
    against(state, bench::overviewRequest);
}
void nullOperation(benchmark::State& state) {
    against(state, bench::nothingRequest);
}

void eachNumberAndPlacement(benchmark::internal::Benchmark* benchmark) {
    benchmark->ArgNames({"clients", "apart"})->ArgsProduct({{1, 8, 64}, {0, 1}})->Iterations(100);
    benchmark->Unit(benchmark::kMillisecond);
}
BENCHMARK(overview)->Apply(eachNumberAndPlacement);
BENCHMARK(nullOperation)->Apply(eachNumberAndPlacement);

}  // namespace

BENCHMARK_MAIN();
