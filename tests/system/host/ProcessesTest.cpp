// Monitor, front and worker: what becomes of requests when one of them ends.

#include "tests/support/TemporaryRoot.h"
#include "tests/system/host/Host.h"

#include <csignal>
#include <fstream>
#include <iterator>

#include <gmock/gmock.h>
#include <sys/prctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;

/// Returns true if the process has ended, reaped or not.
bool hasEnded(pid_t pid) {
    std::ifstream file("/proc/" + std::to_string(pid) + "/stat");
    std::string text;
    std::getline(file, text);
    return text.empty() || text.find(") Z ") != std::string::npos;
}

class Processes : public ::testing::Test {
  protected:
    /// The overview, which a new front may not serve at once.
    [[nodiscard]] Dictionary overview() const { return dictionaryOf(_daemon.connect().get("/v1/")); }
    [[nodiscard]] std::string data() const {
        std::ifstream file(_daemon.directory() / "data");
        return {std::istreambuf_iterator<char>(file), {}};
    }
    void go() const { std::ofstream(_daemon.directory() / "go").put('\n'); }
    /// Waits until the daemon serves operations.
    [[nodiscard]] bool serves() const {
        return eventually([&] { return _daemon.connect().post("/v1/fixture/nothing").status == 204; });
    }

    DaemonProcess _daemon{withFixture()};
};

TEST_F(Processes, FrontThatIsKilledIsReplacedAndItsWorkerFinishesItsWriteFirst) {
    const pid_t front = _daemon.frontPid();
    const pid_t worker = _daemon.workerPid();
    const UnixHttp lost = startHeldWrite(_daemon, _daemon.directory(), "written");
    ::kill(front, SIGKILL);

    // The socket stays: a client that connects meanwhile waits for the next front.
    const Dictionary waiting = overview();
    EXPECT_NE(_daemon.frontPid(), front);
    EXPECT_THAT(waiting.text("workerProblem"),
                HasSubstr("(process " + std::to_string(worker) + ") is finishing its request"));
    EXPECT_FALSE(waiting.contains("workerPid"));
    const HttpReply refused = _daemon.connect().post("/v1/fixture/nothing");
    expectError(refused, 503, "WORKER_UNAVAILABLE");
    EXPECT_TRUE(refused.headers.contains("retry-after"));
    EXPECT_THAT(refused.body, HasSubstr(std::to_string(worker)));
    EXPECT_FALSE(hasEnded(worker));

    go();
    EXPECT_TRUE(serves());
    EXPECT_EQ(data(), "written\n") << "before the next worker was started";
    EXPECT_TRUE(hasEnded(worker));
    EXPECT_FALSE(overview().contains("workerProblem"));
    EXPECT_TRUE(_daemon.waitForLog("the front was killed by signal 9 (Killed); the next one is started in 100 ms"));
    EXPECT_TRUE(_daemon.waitForLog("the worker of the last front ended with status"));
}

TEST_F(Processes, FrontThatIsKilledWithAnIdleWorkerGetsTheNextOneAtOnce) {
    const pid_t worker = _daemon.workerPid();
    ::kill(_daemon.frontPid(), SIGKILL);
    EXPECT_TRUE(serves());
    EXPECT_NE(_daemon.workerPid(), worker);
    EXPECT_TRUE(eventually([&] { return hasEnded(worker); }));
}

TEST_F(Processes, FrontsThatKeepDyingAreStartedAfterAGrowingPause) {
    for (const char* pause : {"100 ms", "200 ms", "400 ms"}) {
        ASSERT_TRUE(eventually([&] { return _daemon.frontPid() > 0; }));
        ::kill(_daemon.frontPid(), SIGKILL);
        EXPECT_TRUE(_daemon.waitForLog(std::string("the next one is started in ") + pause)) << _daemon.log();
    }
    EXPECT_TRUE(serves());
}

#ifndef ADMINHOST_SANITIZED  // a sanitizer needs descriptors of its own
TEST_F(Processes, FrontThatCannotBeStartedAgainIsTriedUntilItCan) {
    rlimit bound{};
    ASSERT_EQ(::prlimit(_daemon.pid(), RLIMIT_NOFILE, nullptr, &bound), 0);
    const rlimit none{3, bound.rlim_max};
    ASSERT_EQ(::prlimit(_daemon.pid(), RLIMIT_NOFILE, &none, nullptr), 0);
    const UnixHttp lost = startHeldWrite(_daemon, _daemon.directory(), "written");
    ::kill(_daemon.frontPid(), SIGKILL);
    EXPECT_TRUE(_daemon.waitForLog("Too many open files; the next try is in 200 ms"));
    EXPECT_TRUE(_daemon.waitForLog("Too many open files; the next try is in 400 ms"));
    ASSERT_EQ(::prlimit(_daemon.pid(), RLIMIT_NOFILE, &bound, nullptr), 0);
    go();
    EXPECT_TRUE(serves());
    EXPECT_EQ(data(), "written\n");
}
#endif

TEST_F(Processes, MonitorThatIsKilledLetsTheFrontFinishTheWriteAndAnswerItsClient) {
    // Here the front is not left to another process, so that its end can be seen.
    ASSERT_EQ(::prctl(PR_SET_CHILD_SUBREAPER, 1), 0);
    const pid_t front = _daemon.frontPid();
    const pid_t worker = _daemon.workerPid();
    UnixHttp client = startHeldWrite(_daemon, _daemon.directory(), "written");
    _daemon.signal(SIGKILL);
    EXPECT_EQ(_daemon.wait(), 128 + SIGKILL);
    EXPECT_FALSE(hasEnded(front));
    go();
    EXPECT_EQ(client.reply().status, 200);
    EXPECT_EQ(data(), "written\n");
    int status = -1;
    EXPECT_EQ(::waitpid(front, &status, 0), front);
#ifndef ADMINHOST_SANITIZED  // the search for leaks fails in a process that may not open its own directory of threads
    EXPECT_EQ(status, 0) << _daemon.log();
#endif
    EXPECT_EQ(::waitpid(worker, nullptr, 0), worker);
    ::prctl(PR_SET_CHILD_SUBREAPER, 0);
}

TEST_F(Processes, MonitorThatIsKilledWhileIdleEndsFrontAndWorker) {
    const pid_t front = _daemon.frontPid();
    const pid_t worker = _daemon.workerPid();
    _daemon.signal(SIGKILL);
    EXPECT_TRUE(eventually([&] { return hasEnded(front) && hasEnded(worker); }));
}

TEST_F(Processes, StopOfTheMonitorWaitsForTheWriteAlsoIfTheFrontHasDied) {
    const UnixHttp lost = startHeldWrite(_daemon, _daemon.directory(), "written");
    const pid_t worker = _daemon.workerPid();
    ::kill(_daemon.frontPid(), SIGKILL);
    ASSERT_THAT(overview().text("workerProblem"), HasSubstr("is finishing"));
    _daemon.signal(SIGTERM);
    EXPECT_EQ(_daemon.wait(std::chrono::milliseconds(100)), std::nullopt);
    go();
    EXPECT_EQ(_daemon.wait(), 0);
    EXPECT_EQ(data(), "written\n");
    EXPECT_TRUE(hasEnded(worker));
}

TEST_F(Processes, SignalsToWorkerAndFrontEndNoRunningWrite) {
    UnixHttp client = startHeldWrite(_daemon, _daemon.directory(), "written");
    const pid_t front = _daemon.frontPid();
    for (const int signal : {SIGTERM, SIGHUP}) {
        ::kill(_daemon.workerPid(), signal);
    }
    ::kill(front, SIGTERM);  // it finishes, as if the daemon were stopped
    go();
    EXPECT_EQ(client.reply().status, 200);
    EXPECT_EQ(data(), "written\n");
    EXPECT_TRUE(serves()) << "with the next front";
    EXPECT_NE(_daemon.frontPid(), front);
}

TEST(ProcessesWithDeadline, MonitorKillsAWorkerThatOverrunsItsDeadlineAfterItsFrontHasDied) {
    const DaemonProcess daemon(withFixture("request_deadline_seconds = 0.2\n"));
    const pid_t worker = daemon.workerPid();
    UnixHttp client = daemon.connect();
    client.begin("POST", "/v1/fixture/runWrite",
                 "{\"script\": \"touch " + (daemon.directory() / "begun").string() + "; exec sleep 100\"}");
    ASSERT_TRUE(eventually([&] { return fs::exists(daemon.directory() / "begun"); }));
    ::kill(worker, SIGSTOP);  // it does not end its tool itself
    ::kill(daemon.frontPid(), SIGKILL);
    EXPECT_TRUE(daemon.waitForLog("the worker " + std::to_string(worker) + " has overrun its deadline, and is killed"));
    EXPECT_TRUE(eventually([&] { return daemon.connect().post("/v1/fixture/nothing").status == 204; }));
}

/// The daemon with a front that closes its link, or its writing half, and ignores a stop.
DaemonProcess::Options withUnlinkedFront(const fs::path& directory, const std::string& closes) {
    fs::copy_file(std::string(BINARY_DIR) + "/bin/adminhostd", directory / "adminhostd");
    fs::create_symlink(std::string(BINARY_DIR) + "/tests/fronts/fixture_unlinked_front",
                       directory / "adminhostd-front");
    DaemonProcess::Options options = withFixture();
    options.program = directory / "adminhostd";
    options.environment = {"ADMINHOST_TEST_CLOSES=" + closes};
    options.waitUntilReady = false;
    return options;
}

TEST(FrontThatClosesItsLink, IsEndedAndReplacedAndDoesNotHoldUpAStop) {
    for (const std::string closes : {"all", "writing"}) {
        const TemporaryRoot place;
        DaemonProcess daemon(withUnlinkedFront(place.path("/"), closes));
        EXPECT_TRUE(daemon.waitForLog("is ended")) << closes << ": " << daemon.log();
        EXPECT_TRUE(daemon.waitForLog("the front was killed by signal 9 (Killed); the next one is started in 100 ms"))
            << closes << ": " << daemon.log();
        daemon.signal(SIGTERM);
        EXPECT_EQ(daemon.wait(), 0) << closes;
    }
}

TEST(FrontProgram, IsNotStartedByHand) {
    const pid_t child = ::fork();
    if (child == 0) {
        const std::string program = std::string(BINARY_DIR) + "/bin/adminhostd-front";
        ::execl(program.c_str(), program.c_str(), nullptr);
        ::_exit(127);
    }
    int status = -1;
    ASSERT_EQ(::waitpid(child, &status, 0), child);
    EXPECT_EQ(WEXITSTATUS(status), 2);
}

}  // namespace
}  // namespace adminhost::test
