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

}  // namespace
}  // namespace adminhost::test
