// What clients rely on beside the answers of commands: the version, checks without a run, deadlines, revisions.

#include "tests/system/host/Host.h"

#include <chrono>

namespace adminhost::test {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

class Interface : public ::testing::Test {
  protected:
    DaemonProcess daemon{withFixture("request_deadline_seconds = 20\n")};
    UnixHttp client = daemon.connect();
};

TEST_F(Interface, OverviewNamesItsVersionAndTheLongestTimeOfAnOperation) {
    const Dictionary overview = dictionaryOf(client.get("/v1/"));
    EXPECT_EQ(overview.get("interface"), Value(1));
    EXPECT_EQ(overview.get("deadlineSeconds").real(), 20.0);
}

TEST_F(Interface, CommandThatIsDescribedButNotServedIs501) {
    expectError(client.post("/v1/fixture/planned", "{}"), 501, "NOT_SERVED");
    expectError(client.post("/v1/fixture/planned?check=1", "{}"), 501, "NOT_SERVED");
    const HttpReply described = client.get("/v1/fixture");
    EXPECT_NE(described.body.find(R"("served":false)"), std::string::npos) << described.body;
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
}

TEST_F(Interface, CheckAloneReturnsNoFindingsAndRunsNothing) {
    const std::string mark = daemon.directory() / "ran";
    const HttpReply reply = client.post("/v1/fixture/runWrite?check=1", R"({"script": "touch )" + mark + R"("})");
    EXPECT_EQ(reply.status, 200);
    EXPECT_EQ(reply.body, "{\"findings\":[]}\n");
    EXPECT_FALSE(reply.headers.contains("etag"));
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    EXPECT_FALSE(std::filesystem::exists(mark));
    EXPECT_EQ(client.post("/v1/fixture/runWrite", R"({"script": "touch )" + mark + R"("})").status, 200);
    EXPECT_TRUE(std::filesystem::exists(mark)) << "the same request runs without the argument";
}

TEST_F(Interface, CheckAloneReturnsTheFindingsOfTheRequest) {
    const HttpReply reply = client.post("/v1/fixture/change?check=1", R"({"bad": 1})");
    expectError(reply, 422, "REQUEST_REFUSED");
    EXPECT_EQ(dictionaryOf(reply).get("findings").array()->size(), 2U);
}

TEST_F(Interface, CheckAloneLeavesTheRevisionAndComparesNone) {
    const std::string before = client.post("/v1/fixture/look", "{}").headers.at("etag");
    EXPECT_EQ(client.post("/v1/fixture/change?check=1", "{}", {"If-Match: \"other\""}).status, 200);
    EXPECT_EQ(client.post("/v1/fixture/look", "{}").headers.at("etag"), before);
}

TEST_F(Interface, AnyOtherValueOfCheckIsRefusedAndRunsNothing) {
    const std::string before = client.post("/v1/fixture/look", "{}").headers.at("etag");
    for (const char* argument : {"check", "check=", "check=0", "check=true", "check=11"}) {
        expectError(client.post(std::string("/v1/fixture/change?") + argument, "{}"), 400, "MALFORMED_ADDRESS");
    }
    expectError(client.get("/v1/doctor?check=1"), 400, "MALFORMED_ADDRESS");
    EXPECT_EQ(client.post("/v1/fixture/look", "{}").headers.at("etag"), before);
}

TEST_F(Interface, AnswerToAWriteCarriesTheNewRevision) {
    const std::string before = client.post("/v1/fixture/look", "{}").headers.at("etag");
    const HttpReply first = client.post("/v1/fixture/change", "{}", {"If-Match: " + before});
    ASSERT_EQ(first.status, 200);
    ASSERT_TRUE(first.headers.contains("etag"));
    EXPECT_NE(first.headers.at("etag"), before);
    EXPECT_EQ(client.post("/v1/fixture/change", "{}", {"If-Match: " + first.headers.at("etag")}).status, 200)
        << "a client can write again without reading";
    EXPECT_NE(client.post("/v1/fixture/look", "{}").headers.at("etag"), first.headers.at("etag"));
}

TEST_F(Interface, ReadDuringWhichSomebodyElseWritesHasTheRevisionBeforeThat) {
    const HttpReply read = client.post("/v1/fixture/look", R"({"changes": 1})");
    ASSERT_EQ(read.status, 200);
    EXPECT_EQ('"' + std::string(dictionaryOf(read).text("revision")) + '"', read.headers.at("etag"));
    expectError(client.post("/v1/fixture/change", "{}", {"If-Match: " + read.headers.at("etag")}), 412,
                "REVISION_CHANGED");
    const HttpReply again = client.post("/v1/fixture/look", "{}");
    EXPECT_EQ(client.post("/v1/fixture/change", "{}", {"If-Match: " + again.headers.at("etag")}).status, 200);
}

TEST_F(Interface, DeadlineOfTheClientShortensThatOfTheOperation) {
    const auto begin = Clock::now();
    const HttpReply reply = client.post("/v1/fixture/run", R"({"script": "sleep 15"})", {"Request-Deadline: 1"});
    expectError(reply, 504, "DEADLINE_EXCEEDED");
    EXPECT_GE(Clock::now() - begin, 1s);
    EXPECT_LT(Clock::now() - begin, 10s);
}

TEST_F(Interface, DeadlineOfTheClientDoesNotLengthenThatOfTheOperation) {
    DaemonProcess quick(withFixture("request_deadline_seconds = 1\n"));
    expectError(quick.connect().post("/v1/fixture/run", R"({"script": "sleep 8"})", {"Request-Deadline: 300"}), 504,
                "DEADLINE_EXCEEDED");
}

TEST_F(Interface, DeadlineOfACommandDoesNotExceedThatOfTheDaemon) {
    ASSERT_NE(client.get("/v1/fixture").body.find(R"("deadlineSeconds":60)"), std::string::npos);
    DaemonProcess quick(withFixture("request_deadline_seconds = 1\n"));
    expectError(quick.connect().post("/v1/fixture/tool", R"({"seconds": 8})"), 504, "DEADLINE_EXCEEDED");
}

TEST_F(Interface, RequestWhoseDeadlinePassesWhileItWaitsIsNotRun) {
    UnixHttp sleeper = startSleeping(daemon, 2500);
    const std::string mark = daemon.directory() / "ran";
    const HttpReply reply =
        client.post("/v1/fixture/runWrite", R"({"script": "touch )" + mark + R"("})", {"Request-Deadline: 1"});
    expectError(reply, 504, "DEADLINE_EXCEEDED");
    EXPECT_NE(reply.body.find("nothing was done"), std::string::npos) << reply.body;
    EXPECT_EQ(sleeper.reply().status, 200);
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    EXPECT_FALSE(std::filesystem::exists(mark));
}

TEST_F(Interface, MalformedDeadlineIs400AndRunsNothing) {
    const std::string before = client.post("/v1/fixture/look", "{}").headers.at("etag");
    for (const char* value : {"0", "-1", "1.5", "1s", "soon", ""}) {
        expectError(client.post("/v1/fixture/change", "{}", {std::string("Request-Deadline: ") + value}), 400,
                    "MALFORMED_DEADLINE");
    }
    EXPECT_EQ(client.post("/v1/fixture/look", "{}", {"Request-Deadline: 99999999999999999999999"}).headers.at("etag"),
              before);
}

}  // namespace
}  // namespace adminhost::test
