// The queue under pressure: requests that are cancelled, abandoned, identical or urgent.

#include "adminhostd/OperationQueue.h"
#include "tests/system/host/Host.h"

#include <csignal>
#include <fstream>
#include <iterator>

#include <unistd.h>

namespace adminhost::test {
namespace {

using namespace std::chrono_literals;

class Queue : public ::testing::Test {
  protected:
    /// A client whose script runs or waits.
    [[nodiscard]] UnixHttp begin(const std::string& command, const std::string& script,
                                 const UnixHttp::Headers& headers = {}) const {
        UnixHttp client = daemon.connect();
        client.begin("POST", "/v1/fixture/" + command, jsonOf(Dictionary{{"script", script}}), headers);
        return client;
    }
    /// Begins so many identical reads, one client each, and waits until all of them wait.
    [[nodiscard]] std::vector<UnixHttp> beginReads(std::uint64_t count, const std::string& command,
                                                   const std::string& body) const {
        std::vector<UnixHttp> clients;
        while (clients.size() < count) {
            clients.push_back(daemon.connect());
            clients.back().begin("POST", "/v1/fixture/" + command, body);
        }
        waitUntilSoManyWait(count);
        return clients;
    }
    /// A script that adds a word to the list of those that ran.
    [[nodiscard]] std::string mark(const std::string& word) const { return "echo " + word + " >> " + list; }
    [[nodiscard]] std::string ran() const {
        std::ifstream file(list);
        return {std::istreambuf_iterator<char>(file), {}};
    }
    void waitUntilSoManyWait(std::uint64_t count) const {
        ASSERT_TRUE(eventually([&] { return waiting() == Value(count); })) << jsonOf(waiting());
    }
    [[nodiscard]] Value waiting() const { return dictionaryOf(daemon.connect().get("/v1/")).get("waiting"); }
    [[nodiscard]] HttpReply cancel(const std::string& id) const {
        return daemon.connect().request("DELETE", "/v1/requests/" + id);
    }

    DaemonProcess daemon{withFixture("queue_limit = 4\n")};
    const std::string list = daemon.directory() / "ran";
    const std::string first = "00000000-0000-0000-0000-000000000001";
    const std::string second = "00000000-0000-0000-0000-000000000002";
};

TEST_F(Queue, WaitingRequestThatIsCancelledNeverRuns) {
    UnixHttp sleeper = startSleeping(daemon, 1500);
    UnixHttp waits = begin("runWrite", mark("cancelled"), {"Request-Id: " + first});
    waitUntilSoManyWait(1);
    const HttpReply reply = cancel(first);
    EXPECT_EQ(reply.status, 200) << reply.body;
    EXPECT_EQ(dictionaryOf(reply).get("state"), Value("waiting"));
    expectError(waits.reply(), 503, "CANCELLED");
    EXPECT_TRUE(daemon.waitForLog(": cancelled; it was sent by uid " + std::to_string(::geteuid()))) << daemon.log();
    EXPECT_EQ(waiting(), Value(0));
    EXPECT_EQ(sleeper.reply().status, 200) << "the running one is not touched";
    EXPECT_EQ(begin("run", mark("after")).reply().status, 200);
    EXPECT_EQ(ran(), "after\n");
    expectError(cancel(first), 409, "REQUEST_ENDED");
    expectError(cancel(second), 404, "UNKNOWN_REQUEST");
}

TEST_F(Queue, RunningReadThatIsCancelledEndsAtOnceWithItsTools) {
    const std::string tool = daemon.directory() / "tool";
    UnixHttp reader =
        begin("run", "echo $$ > " + tool + "; " + mark("begun") + "; exec sleep 60", {"Request-Id: " + first});
    UnixHttp other = begin("run", mark("other"));
    ASSERT_TRUE(eventually([&] { return ran() == "begun\n"; }));
    pid_t pid = 0;
    std::ifstream(tool) >> pid;
    ASSERT_EQ(::kill(pid, 0), 0);
    const auto start = std::chrono::steady_clock::now();
    const HttpReply reply = cancel(first);
    EXPECT_EQ(reply.status, 200) << reply.body;
    EXPECT_EQ(dictionaryOf(reply).get("state"), Value("running"));
    const HttpReply ended = reader.reply();
    expectError(ended, 503, "CANCELLED");
    EXPECT_LT(std::chrono::steady_clock::now() - start, 10s);
    EXPECT_TRUE(eventually([&] { return ::kill(pid, 0) != 0; })) << "its tool goes on";
    EXPECT_FALSE(ended.headers.contains("retry-after"));
    EXPECT_EQ(other.reply().status, 200) << "the next worker serves those that wait";
    EXPECT_EQ(dictionaryOf(daemon.connect().get("/v1/requests/" + first)).get("error"), Value("CANCELLED"));
    EXPECT_TRUE(daemon.waitForLog("was ended because its request was cancelled")) << daemon.log();
}

TEST_F(Queue, RunningChangeIsNotCancelled) {
    UnixHttp writer = begin("runWrite", mark("begun") + "; sleep 1; " + mark("ended"), {"Request-Id: " + first});
    ASSERT_TRUE(eventually([&] { return ran() == "begun\n"; }));
    const HttpReply reply = cancel(first);
    expectError(reply, 409, "CHANGE_RUNNING");
    EXPECT_NE(reply.body.find("half of a change"), std::string::npos) << reply.body;
    EXPECT_EQ(writer.reply().status, 200);
    EXPECT_EQ(ran(), "begun\nended\n");
}

TEST_F(Queue, WaitingDoctorIsCancelledLikeAnyRead) {
    UnixHttp sleeper = startSleeping(daemon, 1500);
    UnixHttp doctor = daemon.connect();
    doctor.begin("GET", "/v1/doctor", "", {"Request-Id: " + first});
    waitUntilSoManyWait(1);
    EXPECT_EQ(cancel(first).status, 200);
    expectError(doctor.reply(), 503, "CANCELLED");
    EXPECT_EQ(sleeper.reply().status, 200);
}

TEST_F(Queue, RequestsOfVanishedClientsLeaveTheQueueBeforeTheirTurn) {
    UnixHttp sleeper = startSleeping(daemon, 2500);
    for (int i = 0; i < 3; ++i) {
        UnixHttp gone = begin(i == 0 ? "runWrite" : "run", mark("gone"));
        waitUntilSoManyWait(1);
        gone.close();
        waitUntilSoManyWait(0);
    }
    EXPECT_EQ(sleeper.reply().status, 200);
    EXPECT_EQ(begin("run", mark("after")).reply().status, 200);
    EXPECT_EQ(ran(), "after\n");
    EXPECT_TRUE(daemon.waitForLog("503 CLIENT_GONE")) << daemon.log();
}

TEST_F(Queue, FullQueueMakesRoomForOthersThanVanishedClients) {
    UnixHttp sleeper = startSleeping(daemon, 1500);
    {
        std::vector<UnixHttp> gone;
        for (const char* word : {"a", "b", "c", "d"}) {
            gone.push_back(begin("run", mark(word)));
        }
        waitUntilSoManyWait(4);
        expectError(begin("run", mark("surplus")).reply(), 503, "TOO_MANY_WAITING");
    }
    EXPECT_EQ(begin("run", mark("after")).reply().status, 200) << "the queue is full of requests that nobody wants";
    EXPECT_EQ(sleeper.reply().status, 200);
    EXPECT_EQ(ran(), "after\n");
}

TEST_F(Queue, StopIsAcceptedWhenItIsFullOfReads) {
    UnixHttp sleeper = startSleeping(daemon, 1500);
    std::vector<UnixHttp> readers;
    for (const char* word : {"a", "b", "c", "d"}) {
        readers.push_back(begin("run", mark(word)));
    }
    waitUntilSoManyWait(4);
    std::vector<UnixHttp> stops;
    for (std::uint64_t i = 0; i < OperationQueue::urgentReserve; ++i) {
        stops.push_back(begin("runControl", mark("stop")));
        waitUntilSoManyWait(5 + i);
    }
    expectError(begin("runControl", mark("surplus")).reply(), 503, "TOO_MANY_WAITING");
    expectError(begin("runWrite", mark("surplus")).reply(), 503, "TOO_MANY_WAITING");
    for (UnixHttp& stop : stops) {
        EXPECT_EQ(stop.reply().status, 200);
    }
    for (UnixHttp& reader : readers) {
        EXPECT_EQ(reader.reply().status, 200);
    }
    EXPECT_EQ(ran(), "stop\nstop\nstop\nstop\na\nb\nc\nd\n");
}

TEST_F(Queue, RequestIsAcceptedWithoutRoomToWaitWhileTheWorkerOfAnIdleDaemonIsReplaced) {
    const DaemonProcess small(withFixture("queue_limit = 0\n"));
    UnixHttp client = small.connect();
    EXPECT_EQ(client.post("/v1/fixture/nothing").status, 204);
    ::kill(small.workerPid(), SIGKILL);
    ASSERT_TRUE(small.waitForLog("was killed by signal 9"));
    EXPECT_EQ(client.post("/v1/fixture/nothing").status, 204);
}

TEST_F(Queue, IdenticalWaitingReadsRunOnceAndEachHasItsAnswer) {
    UnixHttp sleeper = startSleeping(daemon, 1000);
    std::vector<UnixHttp> readers;
    for (int i = 0; i < 3; ++i) {
        readers.push_back(begin("run", mark("once")));
    }
    waitUntilSoManyWait(3);
    EXPECT_EQ(sleeper.reply().status, 200);
    std::string body;
    for (UnixHttp& reader : readers) {
        const HttpReply reply = reader.reply();
        EXPECT_EQ(reply.status, 200);
        EXPECT_TRUE(body.empty() || reply.body == body);
        body = reply.body;
    }
    EXPECT_EQ(ran(), "once\n");
}

TEST_F(Queue, ReadThatHasStartedAnswersNoLaterOne) {
    UnixHttp running = begin("run", mark("read") + "; sleep 1");
    ASSERT_TRUE(eventually([&] { return ran() == "read\n"; }));
    UnixHttp later = begin("run", mark("read") + "; sleep 1");
    EXPECT_EQ(running.reply().status, 200);
    EXPECT_EQ(later.reply().status, 200);
    EXPECT_EQ(ran(), "read\nread\n");
}

TEST_F(Queue, IdenticalReadsWithAWriteBetweenThemRunEachForItself) {
    UnixHttp sleeper = startSleeping(daemon, 1000);
    UnixHttp before = begin("run", mark("read"));
    waitUntilSoManyWait(1);
    UnixHttp writer = begin("runWrite", mark("write"));
    waitUntilSoManyWait(2);
    UnixHttp after = begin("run", mark("read"));
    waitUntilSoManyWait(3);
    for (UnixHttp* client : {&sleeper, &before, &writer, &after}) {
        EXPECT_EQ(client->reply().status, 200);
    }
    EXPECT_EQ(ran(), "read\nwrite\nread\n");
}

TEST_F(Queue, ReportsOfASharedRunBelongToEachOfItsRequests) {
    UnixHttp sleeper = startSleeping(daemon, 1000);
    std::vector<UnixHttp> readers = beginReads(2, "report", R"({"parts": 2})");
    EXPECT_EQ(sleeper.reply().status, 200);
    for (UnixHttp& reader : readers) {
        const HttpReply reply = reader.reply();
        EXPECT_EQ(reply.headers.at("adminhost-not-done"), "2");
        const Dictionary record = dictionaryOf(daemon.connect().get("/v1/requests/" + reply.headers.at("request-id")));
        EXPECT_EQ(record.get("notDone").array()->size(), 2U);
    }
}

TEST_F(Queue, CancellingOneOfASharedRunLeavesTheOthersTheirAnswer) {
    UnixHttp sleeper = startSleeping(daemon, 700);
    const std::string script = mark("run") + "; sleep 1";
    UnixHttp leader = begin("run", script, {"Request-Id: " + first});
    waitUntilSoManyWait(1);
    UnixHttp sharer = begin("run", script, {"Request-Id: " + second});
    UnixHttp third = begin("run", script);
    waitUntilSoManyWait(3);
    EXPECT_EQ(sleeper.reply().status, 200);
    ASSERT_TRUE(eventually([&] { return ran() == "run\n"; }));
    EXPECT_EQ(cancel(first).status, 200);
    expectError(leader.reply(), 503, "CANCELLED");
    EXPECT_EQ(cancel(second).status, 200);
    expectError(sharer.reply(), 503, "CANCELLED");
    EXPECT_EQ(third.reply().status, 200);
    EXPECT_EQ(ran(), "run\n");
}

TEST_F(Queue, LargeAnswerOfASharedRunReachesEveryClient) {
    UnixHttp sleeper = startSleeping(daemon, 1000);
    std::vector<UnixHttp> readers = beginReads(4, "large", R"({"bytes": 30000000})");
    EXPECT_EQ(sleeper.reply().status, 200);
    for (UnixHttp& reader : readers) {
        EXPECT_GT(reader.reply().body.size(), 30'000'000U) << "together they are above the bound on unread answers";
    }
}

TEST_F(Queue, StartsAndStopsGoBeforeWaitingReadsButNotBeforeEarlierWrites) {
    UnixHttp sleeper = startSleeping(daemon, 1200);
    std::vector<UnixHttp> clients;
    std::uint64_t count = 0;
    for (const auto& [command, word] : std::vector<std::pair<std::string, std::string>>{
             {"run", "read"}, {"runWrite", "write"}, {"run", "late"}, {"runControl", "control"}}) {
        clients.push_back(begin(command, mark(word)));
        waitUntilSoManyWait(++count);
    }
    EXPECT_EQ(sleeper.reply().status, 200);
    for (UnixHttp& client : clients) {
        EXPECT_EQ(client.reply().status, 200);
    }
    EXPECT_EQ(ran(), "read\nwrite\ncontrol\nlate\n");
}

}  // namespace
}  // namespace adminhost::test
