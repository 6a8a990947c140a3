// Reports of an operation while it is running, and ids that clients choose.

#include "tests/system/host/Host.h"

namespace adminhost::test {
namespace {

Dictionary recordOf(const DaemonProcess& daemon, const std::string& id) {
    return dictionaryOf(daemon.connect().get("/v1/requests/" + id));
}

std::size_t sizeOf(const Value& list) {
    return list.array() == nullptr ? 0 : list.array()->size();
}

class Reports : public ::testing::Test {
  protected:
    [[nodiscard]] Dictionary recordOf(const HttpReply& reply) const {
        return test::recordOf(daemon, reply.headers.at("request-id"));
    }

    DaemonProcess daemon{withFixture("request_deadline_seconds = 1\n")};
    UnixHttp client = daemon.connect();
};

TEST_F(Reports, AreInTheRecordAndTheirNumbersInTheAnswersHeaders) {
    const HttpReply reply = client.post("/v1/fixture/report", R"({"changes": 2, "parts": 1})");
    EXPECT_EQ(reply.status, 204);
    EXPECT_EQ(reply.headers.at("adminhost-changes"), "2");
    EXPECT_EQ(reply.headers.at("adminhost-not-done"), "1");
    EXPECT_TRUE(daemon.waitForLog(" ms, changes: 2 (cameras Studio users: (not set) -> anna; "));
    EXPECT_TRUE(daemon.waitForLog(", not done: 1 (configuration.cameras.0: not changed: camera not found (no row))\n"));
    const Dictionary record = recordOf(reply);
    EXPECT_EQ(record.get("changes").array()->front(), Value(Dictionary{{"section", "cameras"},
                                                                       {"identity", "U0"},
                                                                       {"name", "Studio"},
                                                                       {"key", "users"},
                                                                       {"to", "anna"},
                                                                       {"secret", false},
                                                                       {"undo", Dictionary{{"cameras", Array{}}}}}));
    EXPECT_EQ(sizeOf(record.get("changes")), 2U);
    EXPECT_EQ(record.get("notDone"), Value(Array{Dictionary{{"keyPath", "configuration.cameras.0"},
                                                            {"reason", "not changed: camera not found"},
                                                            {"toolMessage", "no row"}}}));
    EXPECT_FALSE(record.contains("changesDropped"));
    EXPECT_FALSE(record.contains("notDoneDropped"));
}

TEST_F(Reports, WithoutAnyThereAreNoHeaders) {
    const HttpReply reply = client.post("/v1/fixture/nothing", "{}");
    EXPECT_FALSE(reply.headers.contains("adminhost-changes"));
    EXPECT_FALSE(reply.headers.contains("adminhost-not-done"));
    EXPECT_EQ(recordOf(reply).get("changes"), Value(Array{}));
    EXPECT_EQ(recordOf(reply).get("notDone"), Value(Array{}));
}

TEST_F(Reports, BeyondAThousandOfAKindAreCountedOnly) {
    const HttpReply reply = client.post("/v1/fixture/report", R"({"changes": 1003, "parts": 1000})");
    EXPECT_EQ(reply.headers.at("adminhost-changes"), "1003");
    const Dictionary record = recordOf(reply);
    EXPECT_EQ(sizeOf(record.get("changes")), 1000U);
    EXPECT_EQ(record.get("changesDropped"), Value(3));
    EXPECT_EQ(sizeOf(record.get("notDone")), 1000U);
    EXPECT_FALSE(record.contains("notDoneDropped"));
}

TEST_F(Reports, SurviveACrashOfTheWorker) {
    const HttpReply reply = client.post("/v1/fixture/report", R"({"changes": 3, "parts": 2, "crash": true})");
    expectError(reply, 500, "WORKER_FAILED");
    EXPECT_EQ(reply.headers.at("adminhost-changes"), "3");
    EXPECT_EQ(reply.headers.at("adminhost-not-done"), "2");
    EXPECT_EQ(sizeOf(recordOf(reply).get("changes")), 3U);
}

TEST_F(Reports, SurviveADeadlineThatEndsTheWorker) {
    const HttpReply reply = client.post("/v1/fixture/report", R"({"changes": 3, "milliseconds": 20000})");
    expectError(reply, 504, "DEADLINE_EXCEEDED");
    EXPECT_EQ(reply.headers.at("adminhost-changes"), "3");
    EXPECT_EQ(sizeOf(recordOf(reply).get("changes")), 3U);
}

TEST_F(Reports, AreThereWhileTheOperationIsStillRunning) {
    const std::string id = "0f0f0f0f-1111-4222-8333-444455556666";
    UnixHttp running = daemon.connect();
    running.begin("POST", "/v1/fixture/report", R"({"changes": 1, "milliseconds": 900})", {"Request-Id: " + id});
    ASSERT_TRUE(eventually([&] { return sizeOf(test::recordOf(daemon, id).get("changes")) == 1; }));
    EXPECT_EQ(test::recordOf(daemon, id).get("state"), Value("running"));
    EXPECT_EQ(running.reply().status, 204);
}

class RequestIds : public ::testing::Test {
  protected:
    const std::string id = "6ba7b810-9dad-11d1-80b4-00c04fd430c8";
    DaemonProcess daemon{withFixture()};
    UnixHttp client = daemon.connect();
};

TEST_F(RequestIds, ChosenByTheClientIsTheRequests) {
    const HttpReply reply = client.post("/v1/fixture/nothing", "{}", {"Request-Id: " + id});
    EXPECT_EQ(reply.status, 204);
    EXPECT_EQ(reply.headers.at("request-id"), id);
    EXPECT_EQ(recordOf(daemon, id).get("state"), Value("done"));
    EXPECT_EQ(recordOf(daemon, "6BA7B810-9DAD-11D1-80B4-00C04FD430C8").get("command"), Value("nothing"));
    EXPECT_TRUE(daemon.waitForLog("adminhostd: request " + id + " fixture/nothing"));
}

TEST_F(RequestIds, UsedOneIs409AndNothingRuns) {
    EXPECT_EQ(client.post("/v1/fixture/change", "{}", {"Request-Id: " + id}).status, 200);
    const HttpReply again =
        client.post("/v1/fixture/change", "{}", {"Request-Id: 6BA7B810-9DAD-11D1-80B4-00C04FD430C8"});
    expectError(again, 409, "REQUEST_ID_USED");
    EXPECT_NE(again.headers.at("request-id"), id);
    EXPECT_EQ(client.post("/v1/fixture/look").headers.at("etag"), "\"r2\"");
}

TEST_F(RequestIds, UsedOneIs409AlsoWhileTheFirstRequestIsStillArriving) {
    UnixHttp first = daemon.connect();
    EXPECT_EQ(first.get("/v1/").status, 200);
    first.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nRequest-Id: " + id + "\r\nContent-Length: 2\r\n\r\n{");
    EXPECT_EQ(client.get("/v1/").status, 200) << "by now the other request's head has been read";
    expectError(client.post("/v1/fixture/nothing", "{}", {"Request-Id: " + id}), 409, "REQUEST_ID_USED");
    first.send("}");
    EXPECT_EQ(first.reply().status, 200);
}

TEST_F(RequestIds, MalformedOneIs400AndNothingRuns) {
    for (const char* bad : {"", "1", "6ba7b810-9dad-11d1-80b4-00c04fd430c", "6ba7b8109dad11d180b400c04fd430c8",
                            "6ba7b810-9dad-11d1-80b4-00c04fd430c8x", "{6ba7b810-9dad-11d1-80b4-00c04fd430c8}",
                            "6ba7b810-9dad-11d1-80b4-00c04fd430cg"}) {
        expectError(client.post("/v1/fixture/change", "{}", {std::string("Request-Id: ") + bad}), 400,
                    "MALFORMED_REQUEST_ID");
    }
    EXPECT_EQ(client.post("/v1/fixture/look").headers.at("etag"), "\"r1\"");
}

TEST_F(RequestIds, OneInAMalformedHeadIsNotUsedUp) {
    for (const char* rest :
         {"Host: x\r\nContent-Length: 2\r\nContent-Length: 3\r\n\r\n{}", "Content-Length: 2\r\n\r\n{}",
          "Host: x\r\nTransfer-Encoding: chunked\r\nContent-Length: 2\r\n\r\n{}"}) {
        UnixHttp other = daemon.connect();
        other.send("POST /v1/fixture/nothing HTTP/1.1\r\nRequest-Id: " + id + "\r\n" + rest);
        const HttpReply reply = other.reply();
        expectError(reply, 400, "MALFORMED_HEAD");
        EXPECT_NE(reply.headers.at("request-id"), id);
        EXPECT_TRUE(other.closedWithin(std::chrono::seconds(5)));
    }
    EXPECT_EQ(client.post("/v1/fixture/nothing", "{}", {"Request-Id: " + id}).status, 204);
}

TEST_F(RequestIds, RecordThatIsForgottenBeforeTheBodyEndsIsUnknown) {
    EXPECT_EQ(client.post("/v1/fixture/nothing", "{}", {"Request-Id: " + id}).status, 204);
    UnixHttp slow = daemon.connect();
    slow.send("GET /v1/requests/" + id + " HTTP/1.1\r\nHost: x\r\nContent-Length: 1\r\n\r\n");
    constexpr int kept = 200;
    for (int i = 0; i < kept; ++i) {
        EXPECT_EQ(client.post("/v1/fixture/nothing", "{}").status, 204);
    }
    slow.send(" ");
    expectError(slow.reply(), 404, "UNKNOWN_REQUEST");
}

TEST_F(RequestIds, StateIsWaitingRunningDoneOrUnknown) {
    const std::string second = "6ba7b811-9dad-11d1-80b4-00c04fd430c8";
    EXPECT_EQ(recordOf(daemon, id).get("state"), Value("unknown"));
    expectError(client.get("/v1/requests/" + id), 404, "UNKNOWN_REQUEST");
    UnixHttp running = daemon.connect();
    running.begin("POST", "/v1/fixture/sleep", R"({"milliseconds": 700})", {"Request-Id: " + id});
    ASSERT_TRUE(eventually([&] { return recordOf(daemon, id).get("state") == Value("running"); }));
    UnixHttp waiting = daemon.connect();
    waiting.begin("POST", "/v1/fixture/nothing", "{}", {"Request-Id: " + second});
    ASSERT_TRUE(eventually([&] { return recordOf(daemon, second).get("state") == Value("waiting"); }));
    EXPECT_EQ(running.reply().status, 200);
    EXPECT_EQ(waiting.reply().status, 204);
    EXPECT_EQ(recordOf(daemon, id).get("state"), Value("done"));
}

TEST_F(RequestIds, ClientThatLostItsConnectionFindsOutWhatBecameOfItsRequest) {
    UnixHttp lost = daemon.connect();
    lost.begin("POST", "/v1/fixture/sleep", R"({"milliseconds": 400})", {"Request-Id: " + id});
    ASSERT_TRUE(eventually([&] { return recordOf(daemon, id).get("state") == Value("running"); }));
    lost.close();
    ASSERT_TRUE(eventually([&] { return recordOf(daemon, id).get("state") == Value("done"); }));
    EXPECT_EQ(recordOf(daemon, id).get("status"), Value(200));
}

}  // namespace
}  // namespace adminhost::test
