// The bounds on what one client may ask, the configuration's part in them, and clients that are too slow.

#include "tests/system/host/Host.h"

#include <chrono>
#include <fstream>

namespace adminhost::test {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

TEST(Bounds, BodyAboveTheConfiguredSizeIs413) {
    const DaemonProcess daemon(withFixture("body_limit_bytes = 2000\n"));
    UnixHttp client = daemon.connect();
    EXPECT_EQ(client.post("/v1/fixture/echo", R"({"a":")" + std::string(1900, 'x') + "\"}").status, 200);
    const HttpReply reply = client.post("/v1/fixture/echo", R"({"a":")" + std::string(2000, 'x') + "\"}");
    expectError(reply, 413, "BODY_TOO_LARGE");
    EXPECT_NE(reply.body.find("2000 bytes"), std::string::npos) << reply.body;
}

TEST(Bounds, BodyWithMoreValuesOrDeeperThanConfiguredIs413) {
    const DaemonProcess daemon(withFixture("values_limit = 100\ndepth_limit = 3\n"));
    UnixHttp client = daemon.connect();
    std::string list = "{\"a\":[1";
    for (int i = 0; i < 100; ++i) {
        list += ",1";
    }
    expectError(client.post("/v1/fixture/echo", list + "]}"), 413, "BODY_TOO_LARGE");
    EXPECT_EQ(client.post("/v1/fixture/echo", R"({"a":[[1]]})").status, 200);
    const HttpReply deep = client.post("/v1/fixture/echo", R"({"a":[[[1]]]})");
    expectError(deep, 413, "BODY_TOO_DEEP");
    EXPECT_NE(deep.body.find("3 deep"), std::string::npos) << deep.body;
}

TEST(Bounds, HeadAboveTheConfiguredSizeIs431AndItsConnectionIsClosed) {
    const DaemonProcess daemon(withFixture("head_limit_bytes = 1024\n"));
    UnixHttp client = daemon.connect();
    EXPECT_EQ(client.request("GET", "/v1/", "", {"X-Filler: " + std::string(500, 'x')}).status, 200);
    const HttpReply reply = client.request("GET", "/v1/", "", {"X-Filler: " + std::string(2000, 'x')});
    expectError(reply, 431, "HEAD_TOO_LARGE");
    EXPECT_NE(reply.body.find("1024 bytes"), std::string::npos) << reply.body;
    EXPECT_TRUE(client.closedWithin(5s));
}

TEST(Bounds, ConfiguredNumberOfConnectionsIsKept) {
    const DaemonProcess daemon(withFixture("connection_limit = 8\n"));
    std::vector<UnixHttp> clients;
    for (int i = 0; i < 8; ++i) {
        clients.push_back(daemon.connect());
        clients.back().send("GET /v1/ HTTP/1.1\r\n");
    }
    UnixHttp ninth(daemon.socket(), 1s);
    EXPECT_THROW(
        {
            const HttpReply reply = ninth.get("/v1/");
            if (reply.status == 503) {  // not as root: some connections are kept for it
                throw std::runtime_error("refused");
            }
        },
        std::runtime_error);
    clients.clear();
    EXPECT_EQ(daemon.connect().get("/v1/").status, 200);
}

TEST(Bounds, ClientThatSendsAByteNowAndThenIsDropped) {
    const DaemonProcess daemon(withFixture("client_timeout_seconds = 1\n"));
    UnixHttp slow = daemon.connect();
    slow.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nContent-Length: 1000\r\n\r\n");
    const auto begin = Clock::now();
    bool closed = false;
    while (!closed && Clock::now() - begin < 8s) {
        try {
            slow.send(" ");
        } catch (const std::runtime_error&) {
            closed = true;
        }
        closed = closed || slow.closedWithin(200ms);
    }
    EXPECT_TRUE(closed) << "each byte came in time, the request did not";
    EXPECT_EQ(daemon.connect().get("/v1/").status, 200);
}

TEST(Bounds, ClientThatReadsAByteNowAndThenIsDropped) {
    const DaemonProcess daemon(withFixture("client_timeout_seconds = 1\n"));
    UnixHttp slow = daemon.connect();
    slow.begin("POST", "/v1/fixture/large", R"({"bytes": 2000000})");
    const auto begin = Clock::now();
    bool closed = false;
    while (!closed && Clock::now() - begin < 20s) {
        closed = slow.readSome(20'000) == 0;
        std::this_thread::sleep_for(200ms);
    }
    EXPECT_TRUE(closed) << "it would have taken more than 20 seconds";
    EXPECT_GE(Clock::now() - begin, 2s) << "it has a time-out for each MiB";
    EXPECT_EQ(daemon.connect().get("/v1/").status, 200);
}

TEST(Bounds, ClientThatVanishesInTheMiddleOfItsAnswerHarmsNobody) {
    const DaemonProcess daemon(withFixture());
    for (int i = 0; i < 3; ++i) {
        UnixHttp client = daemon.connect();
        client.begin("POST", "/v1/fixture/large", R"({"bytes": 20000000})");
        EXPECT_GT(client.readSome(1000), 0U);
        client.close();
        EXPECT_EQ(daemon.connect().post("/v1/fixture/echo", "{}").status, 200);
    }
}

class Reload : public ::testing::Test {
  protected:
    void configure(const std::string& text) {
        std::ofstream(daemon.directory() / "config") << text;
        daemon.signal(SIGHUP);
    }
    DaemonProcess daemon{withFixture("request_deadline_seconds = 20\nlanguages = [\"de\"]\n")};
    UnixHttp client = daemon.connect();
};

TEST_F(Reload, HangupReadsTheConfigurationAgain) {
    configure("request_deadline_seconds = 30\nlanguages = [\"fr\"]\nbody_limit_bytes = 2000\n");
    ASSERT_TRUE(daemon.waitForLog("the configuration has been read again")) << daemon.log();
    EXPECT_EQ(dictionaryOf(client.get("/v1/")).get("deadlineSeconds").real(), 30.0);
    EXPECT_EQ(client.post("/v1/fixture/languages", "{}").body, "{\"languages\":[\"fr\"]}\n");
    expectError(client.post("/v1/fixture/echo", R"({"a":")" + std::string(2000, 'x') + "\"}"), 413, "BODY_TOO_LARGE");
}

TEST_F(Reload, NoRequestIsLostWhileTheWorkerIsReplaced) {
    UnixHttp sleeper = startSleeping(daemon, 1000);
    UnixHttp waits = daemon.connect();
    waits.begin("POST", "/v1/fixture/languages", "{}");
    configure("languages = [\"fr\"]\n");
    ASSERT_TRUE(daemon.waitForLog("the configuration has been read again")) << daemon.log();
    EXPECT_EQ(sleeper.reply().status, 200) << "a running request ends with its worker";
    EXPECT_EQ(waits.reply().body, "{\"languages\":[\"fr\"]}\n");
    EXPECT_EQ(client.get("/v1/").status, 200) << "connections stay";
}

TEST_F(Reload, MistakeIsReportedAndTheOldConfigurationStays) {
    configure("request_deadline_seconds = 30\nqueue_limit = -1\n");
    ASSERT_TRUE(daemon.waitForLog("the configuration was not read again, the old one stays in effect")) << daemon.log();
    EXPECT_NE(daemon.log().find("line 2, column"), std::string::npos) << daemon.log();
    EXPECT_EQ(dictionaryOf(client.get("/v1/")).get("deadlineSeconds").real(), 20.0);
    EXPECT_EQ(client.post("/v1/fixture/languages", "{}").body, "{\"languages\":[\"de\"]}\n");
}

TEST_F(Reload, SettingThatOnlyAStartCanChangeIsReported) {
    configure("connection_limit = 10\nlanguages = [\"fr\"]\n");
    ASSERT_TRUE(daemon.waitForLog("connection_limit cannot be changed while the daemon is running; restart it"));
    EXPECT_EQ(client.post("/v1/fixture/languages", "{}").body, "{\"languages\":[\"fr\"]}\n") << "the others count";
}

}  // namespace
}  // namespace adminhost::test
