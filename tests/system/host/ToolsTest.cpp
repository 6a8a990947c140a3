// After a worker is killed, its tools are ended, but not the services that they have started.

#include "tests/support/SampleRoot.h"
#include "tests/system/host/Host.h"

#include <csignal>
#include <filesystem>
#include <fstream>

#include <sys/stat.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;

/// The state of a process: 'S', 'Z' and so on, or '-' if it does not exist.
char stateOf(pid_t pid) {
    std::ifstream file("/proc/" + std::to_string(pid) + "/stat");
    std::string text;
    std::getline(file, text);
    const std::size_t name = text.rfind(") ");
    return name == std::string::npos ? '-' : text.at(name + 2);
}

bool hasEnded(pid_t pid) {
    const char state = stateOf(pid);
    return state == '-' || state == 'Z' || state == 'X';
}

class Tools : public ::testing::Test {
  protected:
    ~Tools() override {
        for (const pid_t pid : _started) {
            ::kill(pid, SIGKILL);
        }
    }

    /// A client whose request runs the script. There, `mark NAME` writes the id of the last background process, or of
    /// the shell if there is none.
    UnixHttp run(const std::string& script) const {
        UnixHttp client = _daemon.connect();
        const std::string mark =
            "mark() { echo ${!:-$$} > " + place("$1.new") + "; mv " + place("$1.new") + " " + place("$1") + "; }; ";
        client.begin("POST", "/v1/fixture/run", "{\"script\": \"" + mark + script + "\"}");
        return client;
    }
    [[nodiscard]] std::string place(const std::string& name) const { return _daemon.directory() / name; }
    /// Waits for the mark and returns the process that it names, which is killed at the end of the test.
    pid_t marked(const std::string& name) {
        EXPECT_TRUE(eventually([&] { return fs::exists(place(name)); })) << name;
        pid_t pid = -1;
        std::ifstream(place(name)) >> pid;
        EXPECT_GT(pid, 1);
        _started.push_back(pid);
        return pid;
    }
    /// Kills the worker and waits until the daemon has noticed.
    void killWorker(pid_t worker) const {
        ::kill(worker, SIGKILL);
        EXPECT_TRUE(_daemon.waitForLog("the worker was killed by signal 9"));
        EXPECT_TRUE(eventually([&] { return _daemon.workerPid() != worker; }));
    }

    DaemonProcess _daemon{withFixture()};
    std::vector<pid_t> _started;
};

TEST_F(Tools, RunningToolOfAKilledWorkerIsKilledWithItsProcessGroup) {
    UnixHttp client = run("sleep 300 & mark child; sleep 300 & mark second; wait");
    const pid_t child = marked("child");
    const pid_t second = marked("second");
    killWorker(_daemon.workerPid());
    expectError(client.reply(), 500, "WORKER_FAILED");
    EXPECT_TRUE(eventually([&] { return hasEnded(child) && hasEnded(second); }));
}

TEST_F(Tools, ToolThatIsStartingTheServiceIsKilledWithIt) {
    // The service is in the group of its starter, which waits for it to be ready.
    UnixHttp client = run("sleep 300 >/dev/null 2>&1 & mark service; sleep 300");
    const pid_t service = marked("service");
    killWorker(_daemon.workerPid());
    expectError(client.reply(), 500, "WORKER_FAILED");
    EXPECT_TRUE(eventually([&] { return hasEnded(service); }));
}

TEST_F(Tools, ServiceWhoseStarterHasReturnedStaysWhenTheWorkerIsKilled) {
    UnixHttp client = run("sleep 300 >/dev/null 2>&1 & mark service");
    const pid_t service = marked("service");
    EXPECT_EQ(client.reply().status, 200);
    killWorker(_daemon.workerPid());
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    EXPECT_FALSE(hasEnded(service));
}

TEST_F(Tools, ServiceStaysWhenTheWorkerIsKilledWhileItWaitsForTheServicesOutput) {
    const pid_t worker = _daemon.workerPid();
    UnixHttp client = run("sleep 300 & mark service; mark starter");
    const pid_t service = marked("service");
    std::this_thread::sleep_for(std::chrono::milliseconds(20));  // of the 200 ms that the worker waits
    killWorker(worker);
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    EXPECT_FALSE(hasEnded(service));
}

TEST_F(Tools, ServiceStaysWhenTheWorkerIsKilledBeforeItCouldSeeThatTheStarterHasExited) {
    const pid_t worker = _daemon.workerPid();
    UnixHttp client =
        run("echo $$ > " + place("starter.new") + "; mv " + place("starter.new") + " " + place("starter") +
            "; sleep 300 >/dev/null 2>&1 & mark service; until [ -e " + place("go") + " ]; do sleep 0.01; done");
    const pid_t service = marked("service");
    const pid_t starter = marked("starter");
    ::kill(worker, SIGSTOP);
    ASSERT_TRUE(eventually([&] { return stateOf(worker) == 'T'; }));
    std::ofstream(place("go")).put('\n');
    ASSERT_TRUE(eventually([&] { return stateOf(starter) == 'Z'; }));
    killWorker(worker);
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    EXPECT_FALSE(hasEnded(service));
}

/// The sample service, whose control tool starts it without a session of its own.
class SampleService : public Tools {
  protected:
    SampleService() {
        std::string tool = _sample.read("/usr/sbin/lumioctl");
        const std::string setsid = "/usr/bin/setsid ";
        const std::size_t at = tool.find(setsid);
        EXPECT_NE(at, std::string::npos);
        tool.erase(at, setsid.size());
        _sample.write("/usr/sbin/lumioctl", tool);
        EXPECT_EQ(::chmod(_sample.disk("/usr/sbin/lumioctl").c_str(), 0755), 0);
    }
    [[nodiscard]] std::string start() const { return _sample.disk("/usr/sbin/lumioctl") + " server start"; }
    /// The service's process, 0 if it does not run.
    [[nodiscard]] pid_t service() const {
        std::ifstream file(_sample.disk("/var/run/lumioserverd.pid"));
        pid_t pid = 0;
        return file >> pid && !hasEnded(pid) ? pid : 0;
    }

    SampleRoot _sample;
};

TEST_F(SampleService, WorkerKilledInsideItsStartEndsTheStart) {
    _sample.setSwitch("lumioctl.sleep", "300");
    UnixHttp client = run("mark tool; exec " + start());
    const pid_t tool = marked("tool");
    killWorker(_daemon.workerPid());
    expectError(client.reply(), 500, "WORKER_FAILED");
    EXPECT_TRUE(eventually([&] { return hasEnded(tool); }));
    EXPECT_EQ(service(), 0);
}

TEST_F(SampleService, WorkerKilledAfterItsStartLeavesItRunning) {
    UnixHttp client = run(start());
    EXPECT_EQ(client.reply().status, 200);
    const pid_t started = service();
    ASSERT_NE(started, 0);
    EXPECT_EQ(::getsid(started), ::getsid(_daemon.pid())) << "it has not called setsid";
    killWorker(_daemon.workerPid());
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    EXPECT_EQ(service(), started);
    ::kill(started, SIGKILL);
}

TEST_F(Tools, ToolsOfAWorkerThatOverrunsItsDeadlineEndWithIt) {
    DaemonProcess daemon(withFixture("request_deadline_seconds = 0.3\n"));
    const pid_t worker = daemon.workerPid();
    const std::string mark = daemon.directory() / "tool";
    UnixHttp client = daemon.connect();
    client.begin("POST", "/v1/fixture/run",
                 "{\"script\": \"echo $$ > " + mark + ".new; mv " + mark + ".new " + mark + "; sleep 300\"}");
    ASSERT_TRUE(eventually([&] { return fs::exists(mark); }));
    ::kill(worker, SIGSTOP);  // so that it can neither end its tool nor report
    expectError(client.reply(), 504, "DEADLINE_EXCEEDED");
    pid_t tool = -1;
    std::ifstream(mark) >> tool;
    EXPECT_TRUE(eventually([&] { return hasEnded(tool) && hasEnded(worker); }));
}

}  // namespace
}  // namespace adminhost::test
