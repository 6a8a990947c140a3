// What permission and audit add to a request in the front: the rights of the client's account are found out, and its
// events are written to the journal. The journal here is a process that reads its socket and does nothing else; the
// program runs with mounts of its own, where that socket has the journal's place. The floor is one datagram of the
// same size to the same socket.

#include "adminhostd/Audit.h"
#include "adminhostd/Permissions.h"
#include "adminhostd/RequestLog.h"
#include "bench/Alternating.h"
#include "bench/HostClient.h"
#include "platform/log/JournalSocket.h"
#include "platform/log/Log.h"
#include "tests/support/OwnMounts.h"

#include <array>
#include <csignal>
#include <filesystem>
#include <stdexcept>
#include <string>
#include <vector>

#include <benchmark/benchmark.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace adminhost;

const std::string journalPath = "/run/systemd/journal/socket";

/// A process that reads the journal's socket.
class Journal {
  public:
    Journal() : _run("/run", "size=1m,mode=755") {
        std::filesystem::create_directories(std::filesystem::path(journalPath).parent_path());
        const int socket = ::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0);
        const sockaddr_un address = bench::addressOf(journalPath);
        if (::bind(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
            throw std::runtime_error("cannot bind " + journalPath);
        }
        _reader = ::fork();
        if (_reader == 0) {
            std::array<char, 64 << 10> buffer;
            while (::recv(socket, buffer.data(), buffer.size(), 0) >= 0) {
            }
            ::_exit(0);
        }
        ::close(socket);
    }
    Journal(const Journal&) = delete;
    Journal& operator=(const Journal&) = delete;
    ~Journal() {
        ::kill(_reader, SIGKILL);
        ::waitpid(_reader, nullptr, 0);
    }

  private:
    test::Mount _run;
    pid_t _reader = -1;
};

/// Eight tables; the client has its classes from the last one, by one of its groups.
Permissions permissions() {
    std::vector<PermissionOptions> tables(8);
    id_t number = 1000;
    for (PermissionOptions& table : tables) {
        for (int i = 0; i < 4; ++i) {
            table.users.push_back({.id = number++});
            table.groups.push_back({.id = number++});
        }
        table.rights.add(Right::write);
    }
    return {tables, 0, "/etc/adminhostd.toml"};
}

RequestRecord requestOfAClient() {
    RequestRecord record;
    record.id = "3f2b8c1e-0d43-4a8e-9d3a-5a1f6f0f2b11";
    record.plugin = "fixture";
    record.command = "change";
    record.access = "write";
    record.peer = {2000, 2000, 4711, 2000, std::vector<gid_t>(15, 3000), "session-3.scope"};
    record.peer.groups.push_back(1063);
    record.arrival = std::chrono::steady_clock::now();
    return record;
}

/// One request: a change has two events and reports what it has changed.
void request(benchmark::State& state, bool changes) {
    const Journal journal;
    const Permissions permitted = permissions();
    Audit audit;
    RequestRecord record = requestOfAClient();
    if (changes) {
        record.add(Change{"settings", "", "", "port", 80, 8080, false, Dictionary{{"port", 80}}});
    }
    const protocol::Begun begun{record.id, "anna", "anna", ""};
    JournalSocket floor(journalPath);
    const std::string message(500, 'x');
    const auto flush = [&] {
        while (!flushLog() || !floor.flush()) {
            ::usleep(50);
        }
    };
    bench::alternate(
        state, bench::Clock::wall,
        [&] {
            if (!permitted.of(record.peer).has(Right::write)) {
                throw std::runtime_error("not permitted");
            }
            if (changes) {
                audit.begun(record, begun);
            }
            record.close(200, "");
            audit.ended(record);
        },
        [&] { benchmark::DoNotOptimize(floor.write(message, {})); }, flush);
    if (lostEvents() > 0) {
        throw std::runtime_error("events were lost");
    }
}

BENCHMARK_CAPTURE(request, reading, false)->Iterations(20'000)->Unit(benchmark::kMicrosecond);
BENCHMARK_CAPTURE(request, changing, true)->Iterations(20'000)->Unit(benchmark::kMicrosecond);

}  // namespace

int main(int argc, char** argv) {
    adminhost::test::enterOwnMounts(argc, argv);
    adminhost::setLogSink(adminhost::syslogSink());
    benchmark::Initialize(&argc, argv);
    benchmark::RunSpecifiedBenchmarks();
    benchmark::Shutdown();
    return 0;
}
