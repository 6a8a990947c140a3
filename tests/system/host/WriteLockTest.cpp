// Two daemons at once: commands that change something wait for the lock, commands that read do not.

#include "tests/support/Program.h"
#include "tests/support/PrometheusText.h"
#include "tests/system/host/Host.h"

#include <csignal>
#include <fstream>

#include <sys/prctl.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;

class TwoDaemons : public ::testing::Test {
  protected:
    TwoDaemons() {
        std::string path = (fs::temp_directory_path() / "two-daemons.XXXXXX").string();
        EXPECT_NE(::mkdtemp(path.data()), nullptr);
        _directory = path;
        fs::create_directories(_directory / "root/usr/bin");
        fs::create_symlink("/usr/bin/sqlite3", _directory / "root/usr/bin/sqlite3");
    }
    ~TwoDaemons() override { fs::remove_all(_directory); }
    TwoDaemons(const TwoDaemons&) = delete;
    TwoDaemons& operator=(const TwoDaemons&) = delete;

    /// Options of daemons that share the root.
    [[nodiscard]] DaemonProcess::Options options(const std::string& configuration = "") const {
        DaemonProcess::Options options = withFixture(configuration);
        options.arguments.insert(options.arguments.end(), {"--root", _directory / "root"});
        return options;
    }
    [[nodiscard]] std::string place(const std::string& name) const { return _directory / name; }
    [[nodiscard]] std::string read(const std::string& name) const {
        std::ifstream file(place(name));
        return {std::istreambuf_iterator<char>(file), {}};
    }
    [[nodiscard]] UnixHttp startWrite(const DaemonProcess& daemon, const std::string& text) const {
        return startHeldWrite(daemon, _directory, text);
    }
    [[nodiscard]] static std::string body(const std::string& script) { return "{\"script\": \"" + script + "\"}"; }
    void go() const { std::ofstream(place("go")).put('\n'); }

    fs::path _directory;
};

TEST_F(TwoDaemons, OldWorkerInsideAWriteDoesNotOverwriteALaterAcknowledgedOne) {
    for (int round = 0; round < 10; ++round) {
        fs::remove(place("begun"));
        fs::remove(place("go"));
        DaemonProcess old(options());
        const pid_t oldWorker = old.workerPid();
        const UnixHttp lost = startWrite(old, "old");
        old.signal(SIGKILL);  // its worker finishes what it has begun
        DaemonProcess daemon(options());
        UnixHttp client = daemon.connect();
        client.begin("POST", "/v1/fixture/runWrite", body("echo new > " + place("data")));
        std::this_thread::sleep_for(std::chrono::milliseconds(100));
        go();
        EXPECT_EQ(client.reply().status, 200);
        ASSERT_TRUE(eventually([&] { return ::kill(oldWorker, 0) != 0 || read("data") == "new\n"; }));
        ASSERT_TRUE(eventually([&] {
            std::ifstream file("/proc/" + std::to_string(oldWorker) + "/stat");
            std::string text;
            std::getline(file, text);
            return text.empty() || text.find(") Z ") != std::string::npos;
        }));
        EXPECT_EQ(read("data"), "new\n") << "round " << round;
    }
}

TEST_F(TwoDaemons, WhileAHolderIsStoppedReadsAreAnsweredAndAWriteNamesTheHolder) {
    DaemonProcess holder(options());
    const pid_t worker = holder.workerPid();
    UnixHttp stopped = startWrite(holder, "first");
    ::kill(worker, SIGSTOP);
    DaemonProcess daemon(options("request_deadline_seconds = 1.5\n"));
    UnixHttp writer = daemon.connect();
    const auto begin = std::chrono::steady_clock::now();
    writer.begin("POST", "/v1/fixture/runWrite", body("echo second > " + place("data")));
    for (int i = 0; i < 5; ++i) {
        EXPECT_EQ(daemon.connect().post("/v1/fixture/run", body("exit 0")).status, 200);
    }
    EXPECT_LT(std::chrono::steady_clock::now() - begin, std::chrono::milliseconds(1400)) << "reads waited";
    const HttpReply refused = writer.reply();
    EXPECT_GE(std::chrono::steady_clock::now() - begin, std::chrono::milliseconds(1400)) << "it did not wait";
    expectError(refused, 503, "WRITE_LOCKED");
    EXPECT_NE(refused.body.find("Another process (" + std::to_string(worker) + ")"), std::string::npos) << refused.body;
    EXPECT_TRUE(refused.headers.contains("retry-after"));
    EXPECT_EQ(daemon.connect().post("/v1/fixture/run", body("exit 0")).status, 200);
    EXPECT_FALSE(fs::exists(place("data")));
    // Once the holder continues, the next write waits only for its end.
    UnixHttp next = daemon.connect();
    next.begin("POST", "/v1/fixture/runWrite", body("echo third >> " + place("data")));
    go();
    ::kill(worker, SIGCONT);
    EXPECT_EQ(stopped.reply().status, 200);
    EXPECT_EQ(next.reply().status, 200);
    EXPECT_EQ(read("data"), "first\nthird\n");
}

TEST_F(TwoDaemons, ToolsOfAWriteThatWaitsForTheLockAreCounted) {
    DaemonProcess holder(options());
    UnixHttp held = startWrite(holder, "first");
    DaemonProcess daemon(options());
    UnixHttp writer = daemon.connect();
    writer.begin("POST", "/v1/fixture/changeWithTool", "{}");  // each attempt runs one tool before it needs the lock
    UnixHttp client = daemon.connect();
    const auto toolRuns = [&] {
        return parsePrometheusText(client.get("/v1/metrics").body).at("adminhost_tool_runs_total");
    };
    EXPECT_TRUE(eventually([&] { return toolRuns() >= 3; }, std::chrono::seconds(30))) << toolRuns();
    go();
    EXPECT_EQ(held.reply().status, 200);
    EXPECT_EQ(writer.reply().status, 200);
}

TEST_F(TwoDaemons, WriteWithoutTheLockIsAnsweredAtItsDeadlineAlsoWhileAReadIsRunning) {
    DaemonProcess holder(options());
    UnixHttp held = startWrite(holder, "first");
    DaemonProcess daemon(options());
    const auto begin = std::chrono::steady_clock::now();
    UnixHttp writer = daemon.connect();
    writer.begin("POST", "/v1/fixture/runWrite", body("echo second > " + place("data")), {"Request-Deadline: 1"});
    ASSERT_TRUE(eventually([&] { return dictionaryOf(daemon.connect().get("/v1/")).get("waiting") == Value(1); }));
    UnixHttp reader = startSleeping(daemon, 4000);
    expectError(writer.reply(), 503, "WRITE_LOCKED");
    const auto duration = std::chrono::steady_clock::now() - begin;
    EXPECT_GE(duration, std::chrono::milliseconds(900));
    EXPECT_LT(duration, std::chrono::milliseconds(3000)) << "it waited for the end of the read";
    EXPECT_EQ(reader.reply().status, 200);
    go();
    EXPECT_EQ(held.reply().status, 200);
    EXPECT_EQ(read("data"), "first\n");
}

TEST_F(TwoDaemons, WritesKeepTheirOrderWhileTheyWaitForTheLock) {
    DaemonProcess holder(options());
    UnixHttp first = startWrite(holder, "0");
    DaemonProcess daemon(options());
    std::vector<UnixHttp> clients;
    for (int i = 1; i <= 4; ++i) {
        clients.push_back(daemon.connect());
        clients.back().begin("POST", "/v1/fixture/runWrite",
                             body("echo " + std::to_string(i) + " >> " + place("data")));
        ASSERT_TRUE(eventually([&] { return dictionaryOf(daemon.connect().get("/v1/")).get("waiting") == Value(i); }));
    }
    go();
    for (UnixHttp& client : clients) {
        EXPECT_EQ(client.reply().status, 200);
    }
    EXPECT_EQ(read("data"), "0\n1\n2\n3\n4\n");
}

TEST_F(TwoDaemons, AWorkerThatSleptThroughTheEndOfItsFrontDoesNotWriteAnyMore) {
    // With a parent in this session the worker stays stopped when its front ends.
    ASSERT_EQ(::prctl(PR_SET_CHILD_SUBREAPER, 1), 0);
    DaemonProcess old(options());
    const pid_t oldWorker = old.workerPid();
    ::kill(oldWorker, SIGSTOP);
    UnixHttp lost = old.connect();
    lost.begin("POST", "/v1/fixture/runWrite", body("echo old > " + place("data")));
    ASSERT_TRUE(eventually([&] { return !dictionaryOf(old.connect().get("/v1/")).get("running").isNull(); }));
    const pid_t oldFront = old.frontPid();
    old.signal(SIGKILL);
    ::kill(oldFront, SIGKILL);
    EXPECT_EQ(old.wait(), 128 + SIGKILL);
    EXPECT_EQ(::waitpid(oldFront, nullptr, 0), oldFront);
    DaemonProcess daemon(options());
    EXPECT_EQ(daemon.connect().post("/v1/fixture/runWrite", body("echo new > " + place("data"))).status, 200);
    ::kill(oldWorker, SIGCONT);
    EXPECT_EQ(::waitpid(oldWorker, nullptr, 0), oldWorker);
    ::prctl(PR_SET_CHILD_SUBREAPER, 0);
    EXPECT_EQ(read("data"), "new\n");
}

TEST_F(TwoDaemons, LeftoversAreRemovedOnlyWithTheLockByTheFirstWriteAtTheLatest) {
    fs::create_directories(_directory / "root/var");
    const fs::path leftover = _directory / "root/var/adminhost-fixture-leftover";
    std::ofstream(leftover).put('\n');
    {
        DaemonProcess holder(options());
        EXPECT_EQ(holder.connect().post("/v1/fixture/run", body("exit 0")).status, 200);
        EXPECT_FALSE(fs::exists(leftover)) << "at the start";
        UnixHttp writing = startWrite(holder, "first");
        std::ofstream(leftover).put('\n');  // of the write that runs
        DaemonProcess daemon(options());
        EXPECT_EQ(daemon.connect().post("/v1/fixture/run", body("exit 0")).status, 200);
        EXPECT_TRUE(fs::exists(leftover));
        go();
        EXPECT_EQ(writing.reply().status, 200);
        EXPECT_EQ(daemon.connect().post("/v1/fixture/runWrite", body("exit 0")).status, 200);
        EXPECT_FALSE(fs::exists(leftover));
    }
}

TEST_F(TwoDaemons, CheckNeedsNoLockAndRemovesNothing) {
    DaemonProcess holder(options());
    const UnixHttp writing = startWrite(holder, "first");
    const auto check = [&] {
        return runProgram({std::string(BINARY_DIR) + "/bin/adminhostd", "--check", "--root", place("root"), "--socket",
                           place("socket"), "--plugin", pluginFile("fixture_good")},
                          Errors::merge);
    };
    EXPECT_EQ(check().output, "Nothing is wrong. Plug-ins: fixture 1.2.3. Socket: " + place("socket") + "\n");
    go();
    holder.signal(SIGTERM);
    EXPECT_EQ(holder.wait(), 0);
    fs::remove_all(_directory / "root/run");
    fs::create_directories(_directory / "root/var");
    const fs::path leftover = _directory / "root/var/adminhost-fixture-leftover";
    std::ofstream(leftover).put('\n');
    EXPECT_EQ(check().status, 0);
    EXPECT_TRUE(fs::exists(leftover));
    EXPECT_FALSE(fs::exists(_directory / "root/run/adminhostd/private"));
}

}  // namespace
}  // namespace adminhost::test
