// Events: clients that wait for what happens next, and the metrics.

#include "tests/support/PrometheusText.h"
#include "tests/system/host/Host.h"

#include <chrono>

namespace adminhost::test {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

Array eventsOf(const HttpReply& reply) {
    EXPECT_EQ(reply.status, 200) << reply.body;
    const Dictionary body = dictionaryOf(reply);
    return body.get("events").array() == nullptr ? Array() : *body.get("events").array();
}

class Events : public ::testing::Test {
  protected:
    /// The number of the latest event.
    std::uint64_t last() { return dictionaryOf(client.get("/v1/events")).get("last").unsignedInteger().value_or(99); }
    static std::string after(std::uint64_t number) { return "/v1/events?after=" + std::to_string(number); }

    DaemonProcess daemon{withFixture()};
    UnixHttp client = daemon.connect();
};

TEST_F(Events, WhatHappenedAlreadyIsAnsweredAtOnce) {
    EXPECT_EQ(last(), 0U);
    EXPECT_EQ(client.post("/v1/fixture/report", R"({"changes": 2})").status, 204);
    const Array events = eventsOf(client.get(after(0)));
    ASSERT_EQ(events.size(), 2U);
    const Dictionary& change = *events[0].dictionary();
    EXPECT_EQ(change.get("kind"), Value("resourcesChanged"));
    EXPECT_EQ(change.get("section"), Value("cameras"));
    EXPECT_EQ(change.get("keys"), Value(Array{"users"}));
    const Dictionary& end = *events[1].dictionary();
    EXPECT_EQ(end.get("kind"), Value("requestEnded"));
    EXPECT_EQ(end.get("command"), Value("report"));
    EXPECT_EQ(end.get("status"), Value(204));
    EXPECT_EQ(eventsOf(client.get(after(1))).size(), 1U);
}

TEST_F(Events, ClientThatWaitsGetsTheNextEventWhenItHappens) {
    UnixHttp waits = daemon.connect();
    waits.begin("GET", after(0));
    EXPECT_FALSE(waits.closedWithin(200ms));
    EXPECT_EQ(client.post("/v1/fixture/error").status, 500);
    const Array events = eventsOf(waits.reply());
    ASSERT_EQ(events.size(), 1U);
    EXPECT_EQ(events[0].dictionary()->get("error"), Value("SOME_CODE"));
    EXPECT_EQ(events[0].dictionary()->get("number"), Value(1));
}

TEST_F(Events, ClientsThatWaitKeepNobodyFromTheWorker) {
    std::vector<UnixHttp> waiting;
    for (int i = 0; i < 20; ++i) {
        waiting.push_back(daemon.connect());
        waiting.back().begin("GET", after(0));
    }
    EXPECT_EQ(dictionaryOf(client.get("/v1/")).get("waiting"), Value(0));
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    for (UnixHttp& one : waiting) {
        EXPECT_EQ(eventsOf(one.reply()).size(), 1U);
    }
}

TEST_F(Events, NumberOfClientsThatWaitIsBoundedAndThoseThatWentAwayDoNotCount) {
    std::vector<UnixHttp> waiting;
    for (int i = 0; i < 64; ++i) {
        waiting.push_back(daemon.connect());
        waiting.back().begin("GET", after(0));
    }
    UnixHttp surplus = daemon.connect();
    expectError(surplus.get(after(0)), 503, "TOO_MANY_WAITING");
    waiting.clear();
    UnixHttp next = daemon.connect();
    next.begin("GET", after(0));
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    EXPECT_EQ(eventsOf(next.reply()).size(), 1U);
}

TEST_F(Events, StopAnswersThoseThatWaitAtOnce) {
    UnixHttp waits = daemon.connect();
    waits.begin("GET", after(0));
    EXPECT_FALSE(waits.closedWithin(100ms));
    const auto begin = Clock::now();
    daemon.signal(SIGTERM);
    EXPECT_TRUE(eventsOf(waits.reply()).empty());
    EXPECT_EQ(daemon.wait(), 0);
    EXPECT_LT(Clock::now() - begin, 10s);
}

TEST_F(Events, NumbersOfAnotherStartAreMissedEvents) {
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    const std::string epoch(dictionaryOf(client.get("/v1/events")).text("epoch"));
    for (const std::string& address : {after(7), after(1) + "&epoch=other", after(0) + "&epoch=other"}) {
        const HttpReply reply = client.get(address);
        EXPECT_EQ(dictionaryOf(reply).get("missed"), Value(true)) << address;
        EXPECT_EQ(eventsOf(reply).size(), 1U) << address;
    }
    EXPECT_EQ(dictionaryOf(client.get(after(0) + "&epoch=" + epoch)).get("missed"), Value(false));
    for (const char* number : {"x", "-1", "1.5", "99999999999999999999999"}) {
        expectError(client.get(std::string("/v1/events?after=") + number), 400, "MALFORMED_ADDRESS");
    }
}

TEST_F(Events, CheckWithoutARunIsToldFromTheCommandItself) {
    const HttpReply reply = client.post("/v1/fixture/runWrite?check=1", "{}");
    EXPECT_EQ(reply.status, 200);
    EXPECT_EQ(client.post("/v1/fixture/runWrite", R"({"script": "exit 0"})").status, 200);
    const Array events = eventsOf(client.get(after(0)));
    ASSERT_EQ(events.size(), 2U);
    EXPECT_EQ(events[0].dictionary()->get("checkOnly"), Value(true));
    EXPECT_FALSE(events[1].dictionary()->contains("checkOnly"));
    EXPECT_EQ(dictionaryOf(client.get("/v1/requests/" + reply.headers.at("request-id"))).get("checkOnly"), Value(true));
    const PrometheusText text = parsePrometheusText(client.get("/v1/metrics").body);
    EXPECT_EQ(text.sum("adminhost_requests_total", {{"command", "runWrite"}}), 2);
    EXPECT_EQ(text.sum("adminhost_requests_total", {{"command", "runWrite"}, {"check", "1"}}), 1);
    EXPECT_EQ(text.sum("adminhost_request_duration_seconds_count", {{"command", "runWrite"}, {"check", "1"}}), 1);
}

TEST_F(Events, MetricsCountTheWorkOfTheDoctor) {
    EXPECT_EQ(client.get("/v1/doctor").status, 200);
    const PrometheusText text = parsePrometheusText(client.get("/v1/metrics").body);
    EXPECT_GT(text.at("adminhost_resident_memory_bytes", {{"process", "worker"}}), 1e6);
}

TEST_F(Events, MetricsCountWhatHappenedInAFormThatIsRead) {
    EXPECT_EQ(client.post("/v1/fixture/tool", R"({"seconds": 0})").status, 200);
    EXPECT_EQ(client.post("/v1/fixture/tool", R"({"seconds": 0})").status, 200);
    EXPECT_EQ(client.post("/v1/fixture/error").status, 500);
    EXPECT_EQ(client.get("/v1/directory?is=root").status, 200);
    EXPECT_EQ(client.post("/v1/fixture/no-such-command").status, 404);
    const HttpReply reply = client.get("/v1/metrics");
    EXPECT_EQ(reply.status, 200);
    EXPECT_EQ(reply.headers.at("content-type"), "text/plain; version=0.0.4; charset=utf-8");
    const PrometheusText text = parsePrometheusText(reply.body);
    EXPECT_EQ(text.sum("adminhost_requests_total", {{"command", "tool"}, {"status", "200"}}), 2);
    EXPECT_EQ(text.sum("adminhost_requests_total", {{"command", "error"}, {"error", "SOME_CODE"}}), 1);
    EXPECT_EQ(text.sum("adminhost_requests_total", {{"status", "404"}, {"command", ""}}), 1)
        << "names that do not exist are not kept";
    EXPECT_EQ(text.sum("adminhost_request_duration_seconds_count", {{"command", "tool"}}), 2);
    EXPECT_EQ(text.at("adminhost_requests_waiting"), 0);
    EXPECT_EQ(text.at("adminhost_tool_runs_total"), 2);
    EXPECT_GE(text.at("adminhost_directory_lookups_total"), 1);
    EXPECT_EQ(text.at("adminhost_worker_starts_total"), 1);
    EXPECT_GT(text.at("adminhost_resident_memory_bytes", {{"process", "front"}}), 1e6);
    EXPECT_GT(text.at("adminhost_resident_memory_bytes", {{"process", "worker"}}), 1e6);
    client.post("/v1/fixture/crash");
    ASSERT_TRUE(daemon.waitForLog("was killed by signal"));
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    EXPECT_EQ(parsePrometheusText(client.get("/v1/metrics").body).at("adminhost_worker_starts_total"), 2);
}

}  // namespace
}  // namespace adminhost::test
