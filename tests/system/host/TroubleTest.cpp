// Workers that die or hang, clients that misbehave, and stopping the daemon.

#include "tests/system/host/Host.h"

#include <atomic>
#include <csignal>
#include <fstream>

#include <grp.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

TEST(WorkerTrouble, CrashCostsItsOwnRequestAndTheWaitingOnesGoOn) {
    DaemonProcess daemon(withFixture());
    UnixHttp sleeper = startSleeping(daemon, 300);
    UnixHttp crashing = daemon.connect();
    crashing.begin("POST", "/v1/fixture/crash", "{}");
    ASSERT_TRUE(eventually([&] { return dictionaryOf(daemon.connect().get("/v1/")).get("waiting") == Value(1); }));
    UnixHttp waiting = daemon.connect();
    waiting.begin("POST", "/v1/fixture/echo", "{}");
    EXPECT_EQ(sleeper.reply().status, 200);
    const HttpReply reply = crashing.reply();
    expectError(reply, 500, "WORKER_FAILED");
    EXPECT_NE(reply.body.find("signal 11"), std::string::npos) << reply.body;
    EXPECT_EQ(waiting.reply().status, 200);
    const Dictionary record = dictionaryOf(daemon.connect().get("/v1/requests/" + reply.headers.at("request-id")));
    EXPECT_EQ(record.get("log"), Value(Array{Value("about to crash")}));
}

TEST(WorkerTrouble, KilledInTheMiddleOfARequestItIsReplaced) {
    DaemonProcess daemon(withFixture());
    const pid_t first = daemon.workerPid();
    UnixHttp client = startSleeping(daemon, 10'000);
    ::kill(first, SIGKILL);
    expectError(client.reply(), 500, "WORKER_FAILED");
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    EXPECT_NE(daemon.workerPid(), first);
    EXPECT_FALSE(std::filesystem::exists("/proc/" + std::to_string(first))) << "the dead worker was reaped";
}

TEST(WorkerTrouble, KilledWhileIdleItIsReplaced) {
    DaemonProcess daemon(withFixture());
    for (int i = 0; i < 3; ++i) {
        const pid_t worker = daemon.workerPid();
        ::kill(worker, SIGKILL);
        ASSERT_TRUE(eventually([&] { return daemon.workerPid() != worker; }));
        EXPECT_EQ(daemon.connect().post("/v1/fixture/echo", "{}").status, 200);
    }
}

TEST(WorkerTrouble, KilledUnderADaemonThatWasStartedWithSigchldIgnoredItIsReplaced) {
    const auto before = std::signal(SIGCHLD, SIG_IGN);
    DaemonProcess daemon(withFixture());
    static_cast<void>(std::signal(SIGCHLD, before));
    const pid_t first = daemon.workerPid();
    UnixHttp client = startSleeping(daemon, 10'000);
    ::kill(first, SIGKILL);
    expectError(client.reply(), 500, "WORKER_FAILED");
    EXPECT_TRUE(daemon.waitForLog("the worker was killed by signal 9"));
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    EXPECT_NE(daemon.workerPid(), first);
}

TEST(WorkerTrouble, OverrunIs504AndTheNextRequestWorks) {
    DaemonProcess daemon(withFixture("request_deadline_seconds = 0.3\n"));
    UnixHttp client = daemon.connect();
    const pid_t worker = daemon.workerPid();
    expectError(client.post("/v1/fixture/sleep", R"({"milliseconds": 600})"), 504, "DEADLINE_EXCEEDED");
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    EXPECT_EQ(daemon.workerPid(), worker) << "a worker that comes back in time stays";
    expectError(client.post("/v1/fixture/tool", R"({"seconds": 30})"), 504, "DEADLINE_EXCEEDED");
    EXPECT_EQ(daemon.workerPid(), worker) << "the tool was killed, not the worker";
}

TEST(WorkerTrouble, HangingWorkerIsKilledAndReplaced) {
    DaemonProcess daemon(withFixture("request_deadline_seconds = 0.2\n"));
    const pid_t worker = daemon.workerPid();
    UnixHttp client = startSleeping(daemon, 60'000);
    EXPECT_EQ(daemon.connect().get("/v1/").status, 200) << "the front answers meanwhile";
    expectError(client.reply(), 504, "DEADLINE_EXCEEDED");
    EXPECT_EQ(client.post("/v1/fixture/echo", "{}").status, 200);
    EXPECT_NE(daemon.workerPid(), worker);
}

TEST(WorkerTrouble, TooManyWaitingIs503WithRetryAfter) {
    DaemonProcess daemon(withFixture("queue_limit = 1\n"));
    UnixHttp sleeper = startSleeping(daemon, 500);
    UnixHttp waiting = daemon.connect();
    waiting.begin("POST", "/v1/fixture/echo", "{}");
    ASSERT_TRUE(eventually([&] { return dictionaryOf(daemon.connect().get("/v1/")).get("waiting") == Value(1); }));
    const HttpReply refused = daemon.connect().post("/v1/fixture/echo", "{}");
    expectError(refused, 503, "TOO_MANY_WAITING");
    EXPECT_EQ(refused.headers.at("retry-after"), "1");
    EXPECT_EQ(sleeper.reply().status, 200);
    EXPECT_EQ(waiting.reply().status, 200);
}

TEST(WorkerTrouble, WithoutAQueueTheIdleDaemonStillServes) {
    DaemonProcess daemon(withFixture("queue_limit = 0\n"));
    EXPECT_EQ(daemon.connect().post("/v1/fixture/echo", "{}").status, 200);
    UnixHttp sleeper = startSleeping(daemon, 500);
    expectError(daemon.connect().post("/v1/fixture/echo", "{}"), 503, "TOO_MANY_WAITING");
    EXPECT_EQ(sleeper.reply().status, 200);
}

TEST(WorkerTrouble, WorkerThatNeverStopsTalkingFillsNoMemoryAndKeepsNobodyWaiting) {
    auto options = withFixture();
    options.environment = {"ASAN_OPTIONS=quarantine_size_mb=1"};  // else a sanitizer keeps what was given back
    DaemonProcess daemon(options);
    const std::size_t before = residentKilobytesOf(daemon.frontPid());
    UnixHttp talker = daemon.connect();
    talker.begin("POST", "/v1/fixture/flood", R"({"lines": 60, "bytes": 1000000})");
    std::size_t most = 0;
    ASSERT_TRUE(eventually([&] {
        EXPECT_EQ(daemon.connect().get("/v1/").status, 200);
        most = std::max(most, residentKilobytesOf(daemon.frontPid()));
        return std::filesystem::file_size(daemon.directory() / "log") >= 60'000'000;
    }));
    EXPECT_EQ(talker.reply().status, 204);
    EXPECT_LT(most, before + 24'000) << "kilobytes";
}

TEST(WorkerTrouble, RequestWhoseClientWentAwayBeforeItsTurnIsNotRun) {
    DaemonProcess daemon(withFixture());
    UnixHttp sleeper = startSleeping(daemon, 400);
    const std::string mark = (daemon.directory() / "gone").string();
    UnixHttp gone = daemon.connect();
    gone.begin("POST", "/v1/fixture/sleep", R"({"milliseconds":0,"touch":")" + mark + "\"}");
    ASSERT_TRUE(eventually([&] { return dictionaryOf(daemon.connect().get("/v1/")).get("waiting") == Value(1); }));
    gone.close();
    EXPECT_EQ(sleeper.reply().status, 200);
    EXPECT_TRUE(daemon.waitForLog("503 CLIENT_GONE"));
    EXPECT_FALSE(std::filesystem::exists(mark));
}

TEST(WorkerTrouble, WorkerThatCannotStartIsAClearAnswerAndTriedAgain) {
    auto options = withFixture();
    options.arguments = {"--plugin", pluginFile("fixture_crashing_later")};
    DaemonProcess daemon(options);
    UnixHttp client = daemon.connect();
    const HttpReply reply = client.post("/v1/fixture/echo", "{}");
    expectError(reply, 503, "WORKER_UNAVAILABLE");
    EXPECT_TRUE(reply.headers.contains("retry-after"));
    EXPECT_EQ(client.get("/v1/").status, 200);
    EXPECT_TRUE(daemon.waitForLog("the next start is in 200 ms")) << daemon.log();
}

TEST(Clients, ParallelOnesAreAllAnsweredEachInOrderAndNoDescriptorLeaks) {
    DaemonProcess daemon(withFixture());
    const pid_t worker = daemon.workerPid();
    const std::size_t front = descriptorsOf(daemon.frontPid());  // perhaps with the connection just closed
    const std::size_t back = descriptorsOf(worker);
    std::atomic<int> answered = 0;
    std::vector<std::thread> clients;
    for (int who = 0; who < 8; ++who) {
        clients.emplace_back([&, who] {
            for (int round = 0; round < 5; ++round) {
                UnixHttp client = daemon.connect();
                for (int i = 0; i < 40; ++i) {
                    const std::string body = "{\"who\":" + std::to_string(who) + ",\"i\":" + std::to_string(i) + "}";
                    const HttpReply reply = client.post("/v1/fixture/echo", body);
                    if (reply.status == 200 && reply.body.find(body) != std::string::npos) {
                        ++answered;
                    }
                }
            }
        });
    }
    for (std::thread& client : clients) {
        client.join();
    }
    EXPECT_EQ(answered, 8 * 5 * 40);
    EXPECT_TRUE(eventually([&] { return descriptorsOf(daemon.frontPid()) <= front; }));
    EXPECT_EQ(descriptorsOf(worker), back);
    EXPECT_EQ(daemon.workerPid(), worker);
}

TEST(Clients, PipelinedRequestsAreAnsweredInTheirOrder) {
    DaemonProcess daemon(withFixture());
    UnixHttp client = daemon.connect();
    for (int i = 0; i < 5; ++i) {
        client.begin("POST", "/v1/fixture/echo", "{\"i\":" + std::to_string(i) + "}");
    }
    for (int i = 0; i < 5; ++i) {
        EXPECT_EQ(dictionaryOf(client.reply()).at("request.i"), Value(i));
    }
}

TEST(Clients, MalformedHttpIsRefusedAndTheDaemonLivesOn) {
    DaemonProcess daemon(withFixture("client_timeout_seconds = 1\n"));
    for (const std::string& text :
         {std::string("\r\n\r\n\r\n"), std::string("GET\r\n\r\n"), std::string("GET /v1/ HTTP/9.9\r\n\r\n"),
          std::string("GET /v1/ HTTP/1.1\r\n\r\n"), std::string("\x16\x03\x01\0\0\0", 6),
          std::string("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nContent-Length: -1\r\n\r\n"),
          std::string("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nContent-Length: many\r\n\r\n"),
          std::string("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nTransfer-Encoding: chunked\r\n\r\nzz\r\n"),
          "GET /v1/ HTTP/1.1\r\nHost: x\r\nX: " + std::string(100'000, 'x') + "\r\n\r\n",
          "GET /" + std::string(100'000, 'x') + " HTTP/1.1\r\nHost: x\r\n\r\n"}) {
        UnixHttp client = daemon.connect();
        try {
            client.send(text);
            client.send("\r\n\r\n");
            const int status = client.reply().status;
            EXPECT_TRUE(status >= 400 && status < 600) << status << " for " << text.substr(0, 60);
        } catch (const std::runtime_error&) {
            EXPECT_TRUE(client.closedWithin(std::chrono::seconds(10))) << text.substr(0, 60);
        }
    }
    EXPECT_EQ(daemon.connect().get("/v1/").status, 200);
}

TEST(Clients, SlowOnesAreDroppedAlsoWhenTheyKeepSendingALittle) {
    DaemonProcess daemon(withFixture("client_timeout_seconds = 1\n"));
    UnixHttp silent = daemon.connect();
    silent.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\n");
    UnixHttp dripping = daemon.connect();
    dripping.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nContent-Length: 100000\r\n\r\n");
    bool dropped = false;
    for (int i = 0; i < 50 && !dropped; ++i) {
        try {
            dripping.send(" ");
        } catch (const std::runtime_error&) {
            dropped = true;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
    }
    EXPECT_TRUE(dropped);
    EXPECT_TRUE(silent.closedWithin(std::chrono::seconds(5)));
    EXPECT_EQ(daemon.connect().get("/v1/").status, 200);
}

TEST(Clients, OperationMayTakeLongerThanAClientMay) {
    DaemonProcess daemon(withFixture("client_timeout_seconds = 1\n"));
    EXPECT_EQ(daemon.connect().post("/v1/fixture/sleep", R"({"milliseconds": 2600})").status, 200);
}

TEST(Clients, AccountThatIsNeitherRootNorTheDaemonsIsNotPermitted) {
    DaemonProcess daemon(withFixture());
    if (::geteuid() != 0) {
        // An unprivileged account cannot change to another one; here the kernel itself must keep other accounts out.
        struct stat status {};
        ASSERT_EQ(::stat(daemon.socket().c_str(), &status), 0);
        EXPECT_EQ(status.st_mode & S_IRWXO, 0U);
        return;
    }
    // Directory and socket are open to everybody, so that it is the daemon that refuses.
    ASSERT_EQ(::chmod(daemon.directory().c_str(), 0755), 0);
    ASSERT_EQ(::chmod(daemon.socket().c_str(), 0666), 0);
    const pid_t child = ::fork();
    if (child == 0) {
        int status = 1;
        // From inside the directory, because those above it may be closed to other accounts.
        if (::chdir(daemon.directory().c_str()) == 0 && ::setgroups(0, nullptr) == 0 && ::setgid(65534) == 0 &&
            ::setuid(65534) == 0) {
            try {
                UnixHttp client("socket");
                client.send("POST /v1/fixture/echo HTTP/1.1\r\nHost: x\r\nContent-Length: 1000\r\n\r\n");
                const HttpReply reply = client.reply();
                status =
                    reply.status == 403 && reply.body.find("\"error\":\"NOT_PERMITTED\"") != std::string::npos ? 0 : 2;
                status = UnixHttp("socket").get("/v1/").status == 403 ? status : 3;
            } catch (const std::exception&) {
                status = 4;
            }
        }
        ::_exit(status);
    }
    int status = -1;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(status, 0);
    EXPECT_TRUE(daemon.waitForLog("fixture/echo by uid 65534"));
    EXPECT_TRUE(daemon.waitForLog(" /overview by uid 65534")) << "whatever the method";
    const std::string log = daemon.log();
    const std::string before = "adminhostd: request ";
    const std::size_t at = log.rfind(before, log.find(" fixture/echo by uid 65534")) + before.size();
    const std::string id = log.substr(at, log.find(' ', at) - at);
    expectError(daemon.connect().get("/v1/requests/" + id), 404, "UNKNOWN_REQUEST");
}

/// The number of private directories in a directory.
int privateDirectories(const std::filesystem::path& directory) {
    int count = 0;
    for (const auto& entry : std::filesystem::directory_iterator(directory)) {
        count += entry.is_directory() && entry.path().filename().string().starts_with("adminhostd.") ? 1 : 0;
    }
    return count;
}

TEST(End, FinishesTheRunningRequestAnswersTheWaitingAndExitsWithZero) {
    DaemonProcess daemon(withFixture());
    const pid_t worker = daemon.workerPid();
    UnixHttp sleeper = startSleeping(daemon, 700);
    UnixHttp waiting = daemon.connect();
    waiting.begin("POST", "/v1/fixture/echo", "{}");
    ASSERT_TRUE(eventually([&] { return dictionaryOf(daemon.connect().get("/v1/")).get("waiting") == Value(1); }));
    daemon.signal(SIGTERM);
    expectError(waiting.reply(), 503, "STOPPING");
    EXPECT_FALSE(std::filesystem::exists(daemon.socket()));
    EXPECT_EQ(sleeper.reply().status, 200);
    EXPECT_EQ(daemon.wait(), 0);
    EXPECT_TRUE(eventually([&] { return ::kill(worker, 0) != 0; })) << "the worker ends with its front";
    EXPECT_TRUE(std::filesystem::is_empty(daemon.directory() / "tmp"));
    EXPECT_EQ(privateDirectories(daemon.directory()), 0);
}

TEST(End, SignalToTheWorkerTooLetsTheRunningRequestFinish) {
    DaemonProcess daemon(withFixture());
    const pid_t worker = daemon.workerPid();
    UnixHttp sleeper = startSleeping(daemon, 300);
    ::kill(worker, SIGTERM);
    daemon.signal(SIGTERM);
    EXPECT_EQ(sleeper.reply().status, 200);
    EXPECT_EQ(daemon.wait(), 0);
}

TEST(End, RunningWriteHasItsWholeTimeAndIsAnswered) {
    DaemonProcess daemon(withFixture());
    const std::string begun = daemon.directory() / "begun";
    const std::string data = daemon.directory() / "data";
    UnixHttp writer(daemon.socket(), std::chrono::seconds(60));
    writer.begin("POST", "/v1/fixture/runWrite",
                 "{\"script\": \"touch " + begun + "; sleep 13; echo whole > " + data + "\"}");
    ASSERT_TRUE(eventually([&] { return std::filesystem::exists(begun); }));
    daemon.signal(SIGTERM);
    EXPECT_EQ(writer.reply().status, 200);
    EXPECT_EQ(daemon.wait(), 0);
    std::ifstream file(data);
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(file), {}), "whole\n");
}

TEST(End, RunningWriteIsEndedAtItsDeadline) {
    DaemonProcess daemon(withFixture("request_deadline_seconds = 1\n"));
    const std::string begun = daemon.directory() / "begun";
    UnixHttp writer = daemon.connect();
    writer.begin("POST", "/v1/fixture/runWrite", "{\"script\": \"touch " + begun + "; sleep 300\"}");
    ASSERT_TRUE(eventually([&] { return std::filesystem::exists(begun); }));
    daemon.signal(SIGTERM);
    expectError(writer.reply(), 504, "DEADLINE_EXCEEDED");
    EXPECT_EQ(daemon.wait(), 0);
}

TEST(End, RunningWriteWhoseWorkerHangsIsNotAnsweredAsIfItHadNotRun) {
    DaemonProcess daemon(withFixture("request_deadline_seconds = 15\n"));
    const std::string begun = daemon.directory() / "begun";
    const pid_t worker = daemon.workerPid();
    UnixHttp writer(daemon.socket(), std::chrono::seconds(60));
    writer.begin("POST", "/v1/fixture/runWrite", "{\"script\": \"touch " + begun + "; sleep 300\"}");
    ASSERT_TRUE(eventually([&] { return std::filesystem::exists(begun); }, std::chrono::seconds(30)));
    ::kill(worker, SIGSTOP);  // it does not report the overrun itself
    daemon.signal(SIGTERM);
    const HttpReply reply = writer.reply();
    expectError(reply, 504, "DEADLINE_EXCEEDED");
    EXPECT_FALSE(reply.headers.contains("retry-after")) << "a client would send it to the next daemon";
    EXPECT_EQ(daemon.wait(), 0);
}

TEST(End, InterruptLeavesNothingBehind) {
    DaemonProcess daemon(withFixture());
    const pid_t worker = daemon.workerPid();
    daemon.signal(SIGINT);
    EXPECT_EQ(daemon.wait(), 0);
    EXPECT_TRUE(eventually([&] { return ::kill(worker, 0) != 0; }));
    EXPECT_FALSE(std::filesystem::exists(daemon.socket()));
    EXPECT_EQ(privateDirectories(daemon.directory()), 0);
}

TEST(End, PrivateDirectoryOfAKilledDaemonGoesAtTheNextStart) {
    DaemonProcess daemon(withFixture());
    EXPECT_EQ(privateDirectories(daemon.directory()), 1);
    daemon.signal(SIGKILL);
    EXPECT_EQ(daemon.wait(), 128 + SIGKILL);
    EXPECT_EQ(privateDirectories(daemon.directory()), 1);
    auto options = withFixture();
    options.socket = daemon.socket();
    {
        const DaemonProcess next(options);
        // The old worker ends by itself; until then it may need the directory.
        EXPECT_LE(privateDirectories(daemon.directory()), 2);
    }
    ASSERT_TRUE(eventually([&] {
        const DaemonProcess last(options);
        return privateDirectories(daemon.directory()) == 1;
    }));
    EXPECT_TRUE(std::filesystem::is_empty(daemon.directory() / "tmp"));
}

TEST(End, RunningRequestThatOnlyReadsHasTenSecondsAtMost) {
    DaemonProcess daemon(withFixture());
    UnixHttp sleeper = startSleeping(daemon, 60'000);
    daemon.signal(SIGTERM);
    UnixHttp* client = &sleeper;
    EXPECT_FALSE(client->closedWithin(std::chrono::seconds(8)));
    expectError(client->reply(), 503, "STOPPING");
    EXPECT_EQ(daemon.wait(), 0);
}

TEST(End, IdleDaemonWithAnOpenConnectionEndsAtOnce) {
    DaemonProcess daemon(withFixture());
    UnixHttp idle = daemon.connect();
    EXPECT_EQ(idle.get("/v1/").status, 200);
    daemon.signal(SIGINT);
    EXPECT_EQ(daemon.wait(std::chrono::seconds(2)), 0);
}

TEST(End, WorkerOfAKilledFrontEnds) {
    DaemonProcess daemon(withFixture());
    const pid_t worker = daemon.workerPid();
    daemon.signal(SIGKILL);
    EXPECT_EQ(daemon.wait(), 128 + SIGKILL);
    EXPECT_TRUE(eventually([&] {
        std::ifstream file("/proc/" + std::to_string(worker) + "/stat");
        std::string text;
        std::getline(file, text);
        return text.empty() || text.find(") Z ") != std::string::npos;
    }));
}

}  // namespace
}  // namespace adminhost::test
