// 64 clients at once, while a tool hangs, the directory server never answers, and worker and front are killed in turn.
// Every client must know what became of each of its writes. ADMINHOST_SOAK_SECONDS sets the time; it is 20 seconds
// without.

#include "tests/support/SilentServer.h"
#include "tests/system/host/Host.h"

#include <algorithm>
#include <array>
#include <atomic>
#include <chrono>
#include <csignal>
#include <cstdio>
#include <cstdlib>
#include <fstream>
#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <stdexcept>
#include <string>
#include <thread>
#include <vector>

namespace adminhost::test {
namespace {

using Clock = std::chrono::steady_clock;
using namespace std::chrono_literals;

constexpr std::size_t clientCount = 64;

std::chrono::seconds soakTime() {
    const char* const text = std::getenv("ADMINHOST_SOAK_SECONDS");
    return std::chrono::seconds(text == nullptr ? 20 : std::max(std::atoi(text), 5));
}

std::string newId() {
    static std::atomic<unsigned> number = 0;
    std::array<char, 37> text{};
    std::snprintf(text.data(), text.size(), "00000000-0000-4000-8000-%012x", ++number);
    return text.data();
}

/// What clients found out about their writes, and what they counted.
struct Outcomes {
    std::set<std::string> done;     ///< acknowledged, or done by the request's record
    std::set<std::string> refused;  ///< refused before they ran
    std::set<std::string> failed;   ///< the worker died, or the time was over: may have happened
    std::set<std::string> applied;  ///< unknown to the daemon, and found to have happened
    std::set<std::string> dropped;  ///< unknown to the daemon, and found not to have happened
    std::vector<std::string> unexpected;
    std::size_t lost = 0;  ///< connections that ended before their answer
    std::size_t reads = 0;
    std::vector<double> milliseconds;  ///< of acknowledged writes

    void add(Outcomes& other) {
        for (auto set :
             {&Outcomes::done, &Outcomes::refused, &Outcomes::failed, &Outcomes::applied, &Outcomes::dropped}) {
            (this->*set).merge(other.*set);
        }
        unexpected.insert(unexpected.end(), other.unexpected.begin(), other.unexpected.end());
        milliseconds.insert(milliseconds.end(), other.milliseconds.begin(), other.milliseconds.end());
        lost += other.lost;
        reads += other.reads;
    }
};

class TroubleSoak : public ::testing::Test {
  protected:
    static DaemonProcess::Options options(int port) {
        auto options = withFixture(
            "queue_limit = 256\nrequest_deadline_seconds = 20\n[directory]\nbudget_seconds = 1\n"
            "[[directory.node]]\nname = \"/Silent\"\nuri = [\"ldap://127.0.0.1:" +
            std::to_string(port) +
            "\"]\nbase = \"dc=example\"\ntimeout_seconds = 1\n"
            "[[directory.node]]\nname = \"/Local\"\nkind = \"local\"\n");
        return options;
    }

    [[nodiscard]] std::string dataFile() const { return (daemon.directory() / "data").string(); }
    /// How often each id was written.
    [[nodiscard]] std::map<std::string, int> data() const {
        std::map<std::string, int> counts;
        std::ifstream file(dataFile());
        for (std::string id; std::getline(file, id);) {
            ++counts[id];
        }
        return counts;
    }

    [[nodiscard]] UnixHttp connected() const {
        for (const auto end = Clock::now() + 60s;;) {
            try {
                return UnixHttp(daemon.socket(), 60s);
            } catch (const std::runtime_error&) {
                if (Clock::now() > end) {
                    throw;
                }
                std::this_thread::sleep_for(10ms);
            }
        }
    }

    [[nodiscard]] std::string body(const std::string& id) const {
        return R"({"script": "echo )" + id + " >> '" + dataFile() + "'\"}";
    }

    /// Asks for the record of a write whose connection was lost, until the write is done or the daemon does not know
    /// it. The status of its answer, or 0 if the daemon does not know it.
    [[nodiscard]] int recorded(const std::string& id) const {
        for (const auto end = Clock::now() + 60s; Clock::now() < end; std::this_thread::sleep_for(10ms)) {
            try {
                const HttpReply reply = connected().get("/v1/requests/" + id);
                const auto record = parseJson(reply.body);
                if (reply.status == 404) {
                    return 0;
                }
                if (reply.status == 200 && record && record->dictionary()->get("state") == Value("done")) {
                    return static_cast<int>(record->dictionary()->get("status").integer().value_or(0));
                }
            } catch (const std::runtime_error&) {
                // killed again: the next one is asked
            }
        }
        throw std::runtime_error("no record of a write within a minute");
    }

    void note(const std::string& id, int status, const std::string& text, Outcomes& outcomes) const {
        if (status == 200) {
            outcomes.done.insert(id);
        } else if (status == 503) {
            outcomes.refused.insert(id);
            std::this_thread::sleep_for(100ms);  // a polite client waits as long as Retry-After says
        } else if (status == 500 || status == 504) {
            outcomes.failed.insert(id);
        } else {
            outcomes.unexpected.push_back(std::to_string(status) + ' ' + text);
        }
    }

    /// A write with an id. Writes run one after the other: when a later one is acknowledged, a write of a front that
    /// was killed has happened or never will.
    void write(std::optional<UnixHttp>& client, Outcomes& outcomes) const {
        const std::string id = newId();
        const auto start = Clock::now();
        try {
            const HttpReply reply = client->post("/v1/fixture/runWrite", body(id), {"Request-Id: " + id});
            note(id, reply.status, reply.body, outcomes);
            if (reply.status == 200) {
                outcomes.milliseconds.push_back(
                    std::chrono::duration<double, std::milli>(Clock::now() - start).count());
            }
            return;
        } catch (const std::runtime_error&) {
            ++outcomes.lost;
        }
        client.emplace(connected());
        if (const int status = recorded(id); status != 0) {
            note(id, status, "by the record", outcomes);
            return;
        }
        for (;;) {
            const std::string barrier = newId();
            try {
                const HttpReply reply = client->post("/v1/fixture/runWrite", body(barrier), {"Request-Id: " + barrier});
                note(barrier, reply.status, reply.body, outcomes);
                if (reply.status == 200) {
                    break;
                }
            } catch (const std::runtime_error&) {
                ++outcomes.lost;
                outcomes.failed.insert(barrier);
                client.emplace(connected());
            }
        }
        (data().contains(id) ? outcomes.applied : outcomes.dropped).insert(id);
    }

    /// A write whose client goes away at once and asks for it by its id.
    void writeAndLeave(Outcomes& outcomes) const {
        const std::string id = newId();
        try {
            UnixHttp client = connected();
            client.begin("POST", "/v1/fixture/runWrite", body(id), {"Request-Id: " + id});
            std::this_thread::sleep_for(5ms);
        } catch (const std::runtime_error&) {
            ++outcomes.lost;
        }
        const int status = recorded(id);
        if (status == 0 || status == 499) {
            outcomes.failed.insert(id);
        } else {
            note(id, status, "by the record", outcomes);
        }
    }

    void work(Clock::time_point end, Outcomes& outcomes) const {
        std::optional<UnixHttp> client(connected());
        for (int i = 0; Clock::now() < end; ++i) {
            write(client, outcomes);
            if (i % 8 == 7) {
                writeAndLeave(outcomes);
            }
            for (const auto& [method, target] : {std::pair("GET", "/v1/"), std::pair("POST", "/v1/fixture/nothing")}) {
                try {
                    const HttpReply reply = client->request(method, target, "{}");
                    ++outcomes.reads;
                    if (reply.status / 100 != 2 && reply.status != 503 && reply.status != 500) {
                        outcomes.unexpected.push_back(std::string(target) + ' ' + std::to_string(reply.status));
                    }
                } catch (const std::runtime_error&) {
                    ++outcomes.lost;
                    client.emplace(connected());
                }
            }
        }
    }

    /// Sends a request again and again, whatever becomes of it.
    template <typename Ask>
    std::size_t repeat(Clock::time_point end, std::chrono::milliseconds pause, Ask ask) const {
        std::size_t answered = 0;
        while (Clock::now() < end) {
            try {
                UnixHttp client = connected();
                answered += ask(client).status != 0 ? 1 : 0;
            } catch (const std::runtime_error&) {
                // its front was killed
            }
            std::this_thread::sleep_for(pause);
        }
        return answered;
    }

    SilentServer silent;
    DaemonProcess daemon{options(silent.port())};
};

TEST_F(TroubleSoak, EveryClientKnowsWhatBecameOfEachWriteWhileToolsHangAndProcessesAreKilled) {
    const Clock::time_point end = Clock::now() + soakTime();
    std::size_t hanging = 0;
    std::size_t lookUps = 0;
    std::size_t workersKilled = 0;
    std::size_t frontsKilled = 0;
    Outcomes all;
    std::mutex mutex;
    std::vector<std::thread> threads;
    for (std::size_t i = 0; i < clientCount; ++i) {
        threads.emplace_back([&] {
            Outcomes own;
            try {
                work(end, own);
            } catch (const std::exception& error) {
                own.unexpected.emplace_back(error.what());
            }
            const std::lock_guard lock(mutex);
            all.add(own);
        });
    }
    threads.emplace_back([&] {
        hanging = repeat(end, 3s, [](UnixHttp& client) {
            return client.post("/v1/fixture/tool", R"({"seconds": 600})", {"Request-Deadline: 1"});
        });
    });
    threads.emplace_back([&] {
        lookUps = repeat(end, 2s, [](UnixHttp& client) { return client.get("/v1/directory?is=nobody-has-this-name"); });
    });
    // Twice for each kind at least, in turn.
    const auto pause = std::min<Clock::duration>(soakTime() / 6, 10s);
    for (auto next = Clock::now() + pause; next < end - pause / 2; next += pause) {
        std::this_thread::sleep_until(next);
        const bool worker = workersKilled <= frontsKilled;
        pid_t victim = -1;
        try {
            victim = worker ? daemon.workerPid() : daemon.frontPid();
        } catch (const std::runtime_error&) {
            // it is being replaced at this moment
        }
        if (victim > 0 && ::kill(victim, SIGKILL) == 0) {
            ++(worker ? workersKilled : frontsKilled);
        }
    }
    for (std::thread& thread : threads) {
        thread.join();
    }
    EXPECT_EQ(connected().post("/v1/fixture/runWrite", body("last")).status, 200);
    const auto written = data();
    EXPECT_EQ(written.at("last"), 1);
    const auto count = [&](const std::string& id) { return written.contains(id) ? written.at(id) : 0; };
    const auto expectAll = [&](const std::set<std::string>& ids, int least, int most, const char* what) {
        for (const std::string& id : ids) {
            EXPECT_GE(count(id), least) << what << ' ' << id;
            EXPECT_LE(count(id), most) << what << ' ' << id;
        }
    };
    expectAll(all.done, 1, 1, "acknowledged");
    expectAll(all.refused, 0, 0, "refused");
    expectAll(all.failed, 0, 1, "failed");
    expectAll(all.applied, 1, 1, "applied");
    expectAll(all.dropped, 0, 0, "dropped");
    std::size_t known = 1;  // the last
    for (const auto* set : {&all.done, &all.failed, &all.applied}) {
        known += static_cast<std::size_t>(
            std::count_if(set->begin(), set->end(), [&](const std::string& id) { return count(id) > 0; }));
    }
    EXPECT_EQ(known, written.size()) << "a write that no client knows of";
    EXPECT_TRUE(all.unexpected.empty()) << all.unexpected.size() << ", the first: " << all.unexpected.front();
    EXPECT_GE(workersKilled, 2U);
    EXPECT_GE(frontsKilled, 2U);
    EXPECT_GT(hanging, 0U);
    EXPECT_GT(lookUps, 0U);
    ASSERT_FALSE(all.milliseconds.empty());
    std::sort(all.milliseconds.begin(), all.milliseconds.end());
    const auto quantile = [&](double share) {
        return all.milliseconds[static_cast<std::size_t>(share * static_cast<double>(all.milliseconds.size() - 1))];
    };
    std::printf(
        "%lld s, %zu clients: %zu writes acknowledged (p50 %.1f ms, p99 %.1f ms, at most %.1f ms), %zu refused, %zu "
        "failed, %zu unknown and done, %zu unknown and not done; %zu reads; %zu connections lost; %zu hanging tools, "
        "%zu look-ups in a silent directory, %zu workers and %zu fronts killed\n",
        static_cast<long long>(soakTime().count()), clientCount, all.done.size(), quantile(0.5), quantile(0.99),
        quantile(1), all.refused.size(), all.failed.size(), all.applied.size(), all.dropped.size(), all.reads, all.lost,
        hanging, lookUps, workersKilled, frontsKilled);
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.wait(), 0);
}

TEST(RequestsSoak, DescriptorsAndMemoryAreFlatOverAHundredThousandRequests) {
    constexpr int threads = 8;
    constexpr std::size_t more = 1024;  // kilobytes; a leak of ten bytes in each request is more
    const DaemonProcess daemon(withFixture());
    const auto send = [&](int requests) {
        std::vector<std::thread> clients;
        for (int i = 0; i < threads; ++i) {
            clients.emplace_back([&] {
                for (int n = 0; n < requests / threads / 10; ++n) {
                    UnixHttp client = daemon.connect();  // a connection of its own for every ten
                    for (int k = 0; k < 5; ++k) {
                        EXPECT_EQ(client.get("/v1/").status, 200);
                        EXPECT_EQ(client.post("/v1/fixture/nothing", "{}").status, 204);
                    }
                }
            });
        }
        for (std::thread& client : clients) {
            client.join();
        }
    };
    send(10'000);
    const pid_t worker = daemon.workerPid();
    const std::array<std::size_t, 2> before{residentKilobytesOf(daemon.frontPid()), residentKilobytesOf(worker)};
    const std::array<std::size_t, 2> descriptors{descriptorsOf(daemon.frontPid()), descriptorsOf(worker)};
    send(100'000);
    EXPECT_EQ(daemon.workerPid(), worker);
    EXPECT_LE(residentKilobytesOf(daemon.frontPid()), before[0] + more);
    EXPECT_LE(residentKilobytesOf(worker), before[1] + more);
    EXPECT_TRUE(eventually([&] { return descriptorsOf(daemon.frontPid()) <= descriptors[0]; }))
        << descriptorsOf(daemon.frontPid()) << " descriptors, before " << descriptors[0];
    EXPECT_EQ(descriptorsOf(worker), descriptors[1]);
    std::printf("front %zu kB, worker %zu kB after 10,000 requests; %zu kB, %zu kB after 110,000\n", before[0],
                before[1], residentKilobytesOf(daemon.frontPid()), residentKilobytesOf(worker));
}

}  // namespace
}  // namespace adminhost::test
