// Monitor, front and worker get signals at any time while clients write. ADMINHOST_SEED repeats the draws of a run.

#include "tests/support/TemporaryRoot.h"
#include "tests/system/host/Host.h"

#include <array>
#include <atomic>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <map>
#include <memory>
#include <mutex>
#include <random>
#include <set>
#include <stdexcept>

namespace adminhost::test {
namespace {

using namespace std::chrono_literals;

constexpr int signalCount = 36;
constexpr std::array drawn{SIGTERM, SIGHUP, SIGKILL};
constexpr int writers = 4;
constexpr auto patience = 60s;

unsigned seedOfRun() {
    const char* const text = std::getenv("ADMINHOST_SEED");
    return text == nullptr ? 1 : static_cast<unsigned>(std::strtoul(text, nullptr, 10));
}

class RandomKills : public ::testing::Test {
  protected:
    /// Daemons come one after the other, with one root and one socket.
    [[nodiscard]] DaemonProcess::Options options() const {
        DaemonProcess::Options options = withFixture();
        options.arguments.insert(options.arguments.end(), {"--root", root.path("/")});
        options.socket = root.path("/socket");
        return options;
    }
    /// The front of a monitor that was killed serves its socket until its running write has ended.
    void start() {
        daemon.reset();
        ASSERT_TRUE(eventually(
            [&] {
                try {
                    daemon = std::make_unique<DaemonProcess>(options());
                    return true;
                } catch (const std::runtime_error&) {
                    return false;
                }
            },
            patience));
    }
    [[nodiscard]] std::string body(const std::string& id) const {
        return R"({"script": "echo )" + id + " >> '" + root.path("/data").string() + R"('"})";
    }
    /// The status of the write; 0 if its client does not know what became of it.
    [[nodiscard]] int write(const std::string& id) const {
        try {
            return UnixHttp(root.path("/socket"), patience).post("/v1/fixture/runWrite", body(id)).status;
        } catch (const std::runtime_error&) {
            return 0;
        }
    }
    /// How often each id was written.
    [[nodiscard]] std::map<std::string, int> data() const {
        std::map<std::string, int> counts;
        std::ifstream file(root.path("/data"));
        for (std::string id; std::getline(file, id);) {
            ++counts[id];
        }
        return counts;
    }
    /// Sends the signal to one of the three; a new daemon follows a monitor that it ends.
    void signalOne(unsigned which, int number) {
        if (which == 0) {
            daemon->signal(number);
            if (number != SIGHUP) {
                static_cast<void>(daemon->wait());
                start();
            }
            return;
        }
        pid_t victim = -1;
        try {
            victim = which == 1 ? daemon->frontPid() : daemon->workerPid();
        } catch (const std::runtime_error&) {
            // it is being replaced at this moment
        }
        if (victim > 0) {
            ::kill(victim, number);
        }
    }

    const TemporaryRoot root;
    std::unique_ptr<DaemonProcess> daemon;
};

TEST_F(RandomKills, AcknowledgedWritesAreFoundOnceAndOthersAtMostOnce) {
    const unsigned seed = seedOfRun();
    std::printf("seed %u\n", seed);
    std::mt19937 random(seed);
    start();
    std::atomic<bool> stopping = false;
    std::mutex mutex;
    std::set<std::string> acknowledged;
    std::vector<std::thread> clients;
    for (int client = 0; client < writers; ++client) {
        clients.emplace_back([&, client] {
            for (int i = 0; !stopping; ++i) {
                const std::string id = std::to_string(client) + '-' + std::to_string(i);
                const int status = write(id);
                if (status == 200) {
                    const std::lock_guard lock(mutex);
                    acknowledged.insert(id);
                } else {
                    std::this_thread::sleep_for(5ms);
                }
            }
        });
    }
    for (int i = 0; i < signalCount; ++i) {
        std::this_thread::sleep_for(std::chrono::milliseconds(random() % 300));
        const unsigned which = random() % 3;
        signalOne(which, drawn.at(random() % drawn.size()));
    }
    const std::size_t before = [&] {
        const std::lock_guard lock(mutex);
        return acknowledged.size();
    }();
    EXPECT_TRUE(eventually(
        [&] {
            const std::lock_guard lock(mutex);
            return acknowledged.size() >= before + 10;
        },
        patience))
        << "writes go on after the last signal";
    stopping = true;
    for (std::thread& client : clients) {
        client.join();
    }
    // Writes run one after the other: after this one, no worker of an earlier daemon is still writing.
    EXPECT_EQ(write("last"), 200);
    const auto written = data();
    for (const std::string& id : acknowledged) {
        EXPECT_TRUE(written.contains(id)) << id << " was acknowledged";
    }
    for (const auto& [id, count] : written) {
        EXPECT_EQ(count, 1) << id;
    }
    std::printf("%zu writes acknowledged, %zu found\n", acknowledged.size(), written.size());
    daemon->signal(SIGTERM);
    EXPECT_EQ(daemon->wait(), 0);
}

}  // namespace
}  // namespace adminhost::test
