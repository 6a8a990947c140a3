// Eight clients at once for a minute against daemon, plug-in and the real database tool.

#include "tests/support/DaemonProcess.h"
#include "tests/support/SampleRoot.h"

#include <array>
#include <atomic>
#include <chrono>
#include <csignal>
#include <thread>

#include <gtest/gtest.h>

namespace adminhost {
namespace {

using Clock = std::chrono::steady_clock;

constexpr auto soakTime = std::chrono::seconds(60);
constexpr int clientCount = 8;

struct Tally {
    std::size_t answered = 0;
    std::size_t unexpected = 0;
};

/// One client on one connection. Every answer must belong to its own request, as the listed items show.
void work(const test::DaemonProcess& daemon, Clock::time_point end, Tally& tally) {
    test::UnixHttp connection(daemon.socket(), std::chrono::seconds(60));
    constexpr std::array<std::array<const char*, 3>, 4> rounds{{
        {"/v1/lumio/getCameras", "{}", "\"command\":\"getCameras\""},
        {"/v1/lumio/readSettings", R"({"optionalArguments":{"variant":"getConfig"}})", "\"member_uuid\""},
        {"/v1/lumio/getProperties", "{}", "\"command\":\"getProperties\""},
        {"/v1/lumio/readSettings", R"({"optionalArguments":{"variant":"none"}})", "{\"default_shared_filesystem\""},
    }};
    for (std::size_t i = 0; Clock::now() < end; ++i) {
        const auto& [target, body, expected] = rounds.at(i % rounds.size());
        const test::HttpReply reply = connection.post(target, body);
        const bool good = reply.status == 200 && reply.body.find(expected) != std::string::npos;
        ++(good ? tally.answered : tally.unexpected);
    }
}

TEST(Soak, EightClientsForAMinuteAreAllAnsweredInOrderAndNothingLeaks) {
    const test::SampleRoot root;
    test::DaemonProcess::Options options;
    options.arguments = {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"};
    test::DaemonProcess daemon(options);
    ASSERT_EQ(daemon.connect().post("/v1/lumio/getCameras", "{}").status, 200);
    const pid_t worker = daemon.workerPid();
    const std::size_t frontBefore = test::descriptorsOf(daemon.frontPid());
    const std::size_t workerBefore = test::descriptorsOf(worker);

    std::array<Tally, clientCount> tallies;
    std::vector<std::thread> clients;
    const Clock::time_point end = Clock::now() + soakTime;
    for (Tally& tally : tallies) {
        clients.emplace_back([&] { work(daemon, end, tally); });
    }
    for (std::thread& client : clients) {
        client.join();
    }
    std::size_t answered = 0;
    for (const Tally& tally : tallies) {
        EXPECT_GT(tally.answered, 0U);
        EXPECT_EQ(tally.unexpected, 0U);
        answered += tally.answered;
    }
    EXPECT_EQ(daemon.workerPid(), worker) << "the worker was replaced";
    // The front closes the descriptors of closed connections when it runs the next time, or the time after.
    std::size_t frontAfter = 0;
    for (int i = 0; i < 50; ++i) {
        (void)daemon.connect().get("/v1/");
        frontAfter = test::descriptorsOf(daemon.frontPid());
        if (frontAfter <= frontBefore + 1) {
            break;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    EXPECT_LE(frontAfter, frontBefore + 1);
    EXPECT_EQ(test::descriptorsOf(worker), workerBefore);
    daemon.signal(SIGTERM);
    EXPECT_EQ(daemon.wait(), 0);
    RecordProperty("answered", static_cast<int>(answered));
    std::printf("%zu requests answered\n", answered);
}

}  // namespace
}  // namespace adminhost
