// SIGHUP: the configuration is read again while the daemon serves.

#include "tests/support/TemporaryRoot.h"
#include "tests/system/host/Host.h"

#include <csignal>
#include <fstream>
#include <iterator>
#include <optional>

#include <gmock/gmock.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;

constexpr const char* german = "{\"languages\":[\"de\"]}\n";
constexpr const char* french = "{\"languages\":[\"fr\"]}\n";

class Reload : public ::testing::Test {
  protected:
    void write(const std::string& text) const { std::ofstream(daemon.directory() / "config") << text; }
    void configure(const std::string& text) const {
        write(text);
        daemon.signal(SIGHUP);
    }
    /// How often the log contains the text.
    [[nodiscard]] int logged(const std::string& text) const {
        const std::string log = daemon.log();
        int count = 0;
        for (std::size_t at = log.find(text); at != std::string::npos; at = log.find(text, at + 1)) {
            ++count;
        }
        return count;
    }
    [[nodiscard]] bool readAgain(int times = 1) const {
        return eventually([&] { return logged("the configuration has been read again") >= times; });
    }
    /// Kills the front, and waits until the next one serves operations.
    [[nodiscard]] bool replaceFront() const {
        const pid_t front = daemon.frontPid();
        ::kill(front, SIGKILL);
        return eventually([&] {
            const pid_t next = daemon.frontPid();
            return next > 0 && next != front && daemon.connect().post("/v1/fixture/nothing").status == 204;
        });
    }
    [[nodiscard]] std::string languages() const { return daemon.connect().post("/v1/fixture/languages", "{}").body; }
    [[nodiscard]] std::optional<double> deadline() const {
        return dictionaryOf(daemon.connect().get("/v1/")).get("deadlineSeconds").real();
    }

    DaemonProcess daemon{withFixture("request_deadline_seconds = 20\nlanguages = [\"de\"]\n")};
    UnixHttp client = daemon.connect();
};

TEST_F(Reload, HangupReadsTheConfigurationAgain) {
    configure("request_deadline_seconds = 30\nlanguages = [\"fr\"]\nbody_limit_bytes = 2000\n");
    ASSERT_TRUE(daemon.waitForLog("the configuration has been read again")) << daemon.log();
    EXPECT_EQ(dictionaryOf(client.get("/v1/")).get("deadlineSeconds").real(), 30.0);
    EXPECT_EQ(client.post("/v1/fixture/languages", "{}").body, french);
    expectError(client.post("/v1/fixture/echo", R"({"a":")" + std::string(2000, 'x') + "\"}"), 413, "BODY_TOO_LARGE");
}

TEST_F(Reload, NoRequestIsLostWhileTheWorkerIsReplaced) {
    UnixHttp sleeper = startSleeping(daemon, 1000);
    UnixHttp waits = daemon.connect();
    waits.begin("POST", "/v1/fixture/languages", "{}");
    configure("languages = [\"fr\"]\n");
    ASSERT_TRUE(daemon.waitForLog("the configuration has been read again")) << daemon.log();
    EXPECT_EQ(sleeper.reply().status, 200) << "a running request ends with its worker";
    EXPECT_EQ(waits.reply().body, french);
    EXPECT_EQ(client.get("/v1/").status, 200) << "connections stay";
}

TEST_F(Reload, MistakeIsReportedAndTheOldConfigurationStays) {
    configure("request_deadline_seconds = 30\nqueue_limit = -1\n");
    ASSERT_TRUE(daemon.waitForLog("the configuration was not read again, the old one stays in effect")) << daemon.log();
    EXPECT_NE(daemon.log().find("line 2, column"), std::string::npos) << daemon.log();
    EXPECT_EQ(dictionaryOf(client.get("/v1/")).get("deadlineSeconds").real(), 20.0);
    EXPECT_EQ(client.post("/v1/fixture/languages", "{}").body, german);
}

TEST_F(Reload, SettingThatOnlyAStartCanChangeIsReported) {
    configure("connection_limit = 10\nlanguages = [\"fr\"]\n");
    ASSERT_TRUE(daemon.waitForLog("connection_limit cannot be changed while the daemon is running; restart it"));
    EXPECT_EQ(client.post("/v1/fixture/languages", "{}").body, french) << "the others count";
}

TEST_F(Reload, FrontThatIsKilledAfterARejectedConfigurationIsReplacedWithTheOldOne) {
    configure("request_deadline_seconds = 30\nqueue_limit = -1\n");
    ASSERT_TRUE(daemon.waitForLog("the configuration was not read again"));
    ASSERT_TRUE(replaceFront()) << daemon.log();
    EXPECT_EQ(deadline(), 20.0);
    EXPECT_EQ(languages(), german);
    EXPECT_EQ(logged("line 2, column"), 1) << daemon.log();
}

TEST_F(Reload, ChangedFileTakesEffectAtTheHangupAndNotWithTheNextFront) {
    write("request_deadline_seconds = 30\nlanguages = [\"fr\"]\n");
    ASSERT_TRUE(replaceFront());
    EXPECT_EQ(deadline(), 20.0);
    EXPECT_EQ(languages(), german);
    EXPECT_THAT(daemon.connect().get("/v1/doctor").body, HasSubstr("has changed since the daemon read it"));
    daemon.signal(SIGHUP);
    ASSERT_TRUE(readAgain());
    EXPECT_EQ(deadline(), 30.0);
    EXPECT_EQ(languages(), french);
    ASSERT_TRUE(replaceFront());
    EXPECT_EQ(deadline(), 30.0) << "the next front has what was read last";
}

TEST_F(Reload, FrontAfterARestartKeepsTheSettingsThatOnlyAStartCanChange) {
    configure("socket = \"/elsewhere\"\nconnection_limit = 3\n");
    ASSERT_TRUE(readAgain());
    ASSERT_TRUE(replaceFront());
    std::vector<UnixHttp> clients;
    for (int i = 0; i < 10; ++i) {
        clients.push_back(daemon.connect());
        ASSERT_EQ(clients.back().get("/v1/").status, 200) << i;
    }
}

TEST_F(Reload, HangupThatReachesTheFrontAloneChangesNothing) {
    const pid_t worker = daemon.workerPid();
    write("request_deadline_seconds = 30\nlanguages = [\"fr\"]\n");
    const pid_t front = daemon.frontPid();
    ::kill(front, SIGHUP);
    EXPECT_EQ(languages(), german);
    EXPECT_EQ(deadline(), 20.0);
    EXPECT_EQ(daemon.workerPid(), worker);
    EXPECT_EQ(daemon.frontPid(), front);
    EXPECT_EQ(logged("has been read again"), 0);
}

TEST_F(Reload, HangupDuringAChangeLetsItFinishAndReplacesTheWorkerAfterwards) {
    const pid_t worker = daemon.workerPid();
    UnixHttp writer = startHeldWrite(daemon, daemon.directory(), "written");
    configure("languages = [\"fr\"]\n");
    ASSERT_TRUE(readAgain());
    EXPECT_EQ(daemon.workerPid(), worker);
    std::ofstream(daemon.directory() / "go").put('\n');
    EXPECT_EQ(writer.reply().status, 200);
    std::ifstream data(daemon.directory() / "data");
    EXPECT_EQ(std::string(std::istreambuf_iterator<char>(data), {}), "written\n");
    EXPECT_EQ(languages(), french);
    EXPECT_NE(daemon.workerPid(), worker);
}

TEST_F(Reload, LimitOfTheQueueCountsFromTheNextRequestOn) {
    configure("queue_limit = 1\n");
    ASSERT_TRUE(readAgain());
    ASSERT_EQ(languages().empty(), false) << "the next worker is ready";
    UnixHttp sleeper = startSleeping(daemon, 1000);
    UnixHttp waits = daemon.connect();
    waits.begin("POST", "/v1/fixture/nothing");
    ASSERT_TRUE(eventually([&] { return dictionaryOf(daemon.connect().get("/v1/")).get("waiting") == Value(1); }));
    expectError(daemon.connect().post("/v1/fixture/nothing"), 503, "TOO_MANY_WAITING");
    configure("queue_limit = 2\n");
    ASSERT_TRUE(readAgain(2));
    EXPECT_EQ(daemon.connect().post("/v1/fixture/nothing").status, 204);
    EXPECT_EQ(sleeper.reply().status, 200);
    EXPECT_EQ(waits.reply().status, 204);
}

TEST_F(Reload, NamesOfPermissionsAreLookedUpAgainAlsoIfTheTablesAreTheSame) {
    const std::string tables = "[[permission]]\nusers = [\"no-such-user\"]\nclasses = [\"read\"]\n";
    const std::string problem = "user not found: \"no-such-user\"";
    configure(tables);
    ASSERT_TRUE(readAgain());
    EXPECT_EQ(logged(problem), 1);
    configure(tables);
    ASSERT_TRUE(readAgain(2));
    EXPECT_EQ(logged(problem), 2) << daemon.log();
}

TEST_F(Reload, SocketThatWasReplacedStaysAFailureOfTheDoctor) {
    UnixHttp held = daemon.connect();
    fs::rename(daemon.socket(), daemon.socket() + ".old");
    std::ofstream(daemon.socket()).put('\n');
    EXPECT_THAT(held.get("/v1/doctor").body, HasSubstr("is not the daemon's any more"));
    configure("languages = [\"de\"]\n");
    ASSERT_TRUE(readAgain());
    EXPECT_THAT(held.get("/v1/doctor").body, HasSubstr("is not the daemon's any more"));
}

TEST_F(Reload, HangupsWhileTheNextFrontStartsDoNotEndIt) {
    const pid_t front = daemon.frontPid();
    ::kill(front, SIGKILL);
    ASSERT_TRUE(eventually([&] {
        daemon.signal(SIGHUP);
        const pid_t next = daemon.frontPid();
        return next > 0 && next != front && logged("has been read again") >= 20;
    })) << daemon.log();
    EXPECT_EQ(languages(), german);
    EXPECT_EQ(logged("the front was killed"), 1) << daemon.log();
}

TEST(ReloadOfPlugIns, WorkerWhoseStartIsPausedIsStartedAtOnce) {
    const DaemonProcess daemon({{"--plugin", pluginFile("fixture_crashing_later")}, "", {}, false});
    ASSERT_TRUE(daemon.waitForLog("the next start is in 400 ms"));
    daemon.signal(SIGHUP);
    ASSERT_TRUE(daemon.waitForLog("the configuration has been read again"));
    const std::string shortest = "the next start is in 100 ms";
    EXPECT_TRUE(eventually([&] {
        const std::string log = daemon.log();
        return log.find(shortest) != log.rfind(shortest);
    })) << daemon.log();
}

TEST(ReloadOfPlugIns, PlugInThatWasInstalledMeanwhileIsLoaded) {
    const TemporaryRoot root;
    const fs::path plugins = root.path("/usr/lib/adminhostd/plugins");
    fs::create_directories(plugins);
    DaemonProcess daemon({{"--root", root.path("/")}});
    const auto overview = [&] { return daemon.connect().get("/v1/").body; };
    EXPECT_THAT(overview(), HasSubstr("\"plugins\":[]"));
    fs::copy_file(pluginFile("fixture_good"), plugins / "fixture_good.so");
    std::ofstream(plugins / "writable.so").put('\n');
    ASSERT_EQ(::chmod((plugins / "writable.so").c_str(), 0666), 0);
    daemon.signal(SIGHUP);
    EXPECT_TRUE(eventually([&] { return daemon.connect().post("/v1/fixture/nothing").status == 204; })) << daemon.log();
    EXPECT_THAT(overview(), HasSubstr("writable.so may be written by group or others"));
    fs::remove(plugins / "writable.so");
    daemon.signal(SIGHUP);
    EXPECT_TRUE(eventually([&] { return overview().find("writable.so") == std::string::npos; }));
}

}  // namespace
}  // namespace adminhost::test
