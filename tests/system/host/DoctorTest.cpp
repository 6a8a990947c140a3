// The checks of the installation, with the daemon of this build and the fixture plug-in.

#include "platform/release/Release.h"
#include "tests/system/host/Host.h"

#include <csignal>
#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>

namespace adminhost::test {
namespace {

using ::testing::HasSubstr;

class Doctor : public ::testing::Test {
  protected:
    [[nodiscard]] Array checks() const {
        UnixHttp client(daemon.socket(), std::chrono::seconds(90));
        const HttpReply reply = client.get("/v1/doctor");
        EXPECT_EQ(reply.status, 200) << reply.body;
        const Dictionary answer = dictionaryOf(reply);
        EXPECT_EQ(answer.size(), 1U);
        return answer.get("checks").array() == nullptr ? Array() : *answer.get("checks").array();
    }
    /// The check of that name; empty if there is none.
    [[nodiscard]] Dictionary check(const std::string& name) const {
        for (const Value& one : checks()) {
            if (one.dictionary()->get("name") == Value(name)) {
                return *one.dictionary();
            }
        }
        return {};
    }
    void makePlugin(const std::string& what) const {
        std::ofstream(daemon.directory() / "root" / ("fixture-diagnose-" + what)) << "1";
    }

    const DaemonProcess daemon{withFixture()};
};

TEST_F(Doctor, EveryCheckHasItsFourKeysAndAStateOfThree) {
    const Array all = checks();
    EXPECT_GT(all.size(), 8U);
    for (const Value& one : all) {
        const Dictionary& check = *one.dictionary();
        EXPECT_EQ(check.size(), 4U) << check.text("name");
        EXPECT_THAT(check.text("state"), ::testing::AnyOf("ok", "warning", "failure"));
        EXPECT_NE(check.text("found"), "");
        EXPECT_NE(check.get("fix").string(), nullptr);
    }
}

TEST_F(Doctor, PlugInsOwnChecksHaveItsNameBeforeTheirs) {
    const Dictionary found = check("fixture/sample");
    EXPECT_EQ(found.text("state"), "warning");
    EXPECT_EQ(found.text("found"), "The sample is old.");
    EXPECT_EQ(found.text("fix"), "renew it");
}

TEST_F(Doctor, PlugInThatThrowsIsAFailureAndTheOtherChecksAreThere) {
    makePlugin("throw");
    const Dictionary found = check("fixture");
    EXPECT_EQ(found.text("state"), "failure");
    EXPECT_THAT(found.text("found"), HasSubstr("cannot diagnose"));
    EXPECT_EQ(check("worker").text("state"), "ok");
}

TEST_F(Doctor, WorkerThatDiesLeavesTheFrontsChecks) {
    makePlugin("crash");
    const Dictionary found = check("checks of the worker");
    EXPECT_EQ(found.text("state"), "failure");
    EXPECT_THAT(found.text("found"), HasSubstr("was killed by signal 11"));
    EXPECT_EQ(check("socket").text("state"), "ok");
}

TEST_F(Doctor, RunningDoctorThatIsCancelledEndsWithItsWorkerAndTheNextOneIsWhole) {
    makePlugin("hang");
    const std::string place = "/v1/requests/00000000-0000-0000-0000-000000000001";
    UnixHttp doctor(daemon.socket(), std::chrono::seconds(90));
    doctor.begin("GET", "/v1/doctor", "", {"Request-Id: 00000000-0000-0000-0000-000000000001"});
    ASSERT_TRUE(eventually([&] {
        const auto record = parseJson(daemon.connect().get(place).body);
        return record && record->dictionary()->get("state") == Value("running");
    }));
    const pid_t worker = daemon.workerPid();
    const HttpReply reply = daemon.connect().request("DELETE", place);
    EXPECT_EQ(reply.status, 200) << reply.body;
    EXPECT_EQ(dictionaryOf(reply).get("state"), Value("running"));
    expectError(doctor.reply(), 503, "CANCELLED");
    EXPECT_TRUE(daemon.waitForLog("was ended because its request was cancelled")) << daemon.log();
    std::filesystem::remove(daemon.directory() / "root/fixture-diagnose-hang");
    EXPECT_EQ(check("fixture/sample").text("state"), "warning");
    EXPECT_NE(daemon.workerPid(), worker);
}

TEST_F(Doctor, SocketThatWasReplacedIsAFailure) {
    UnixHttp client = daemon.connect();
    std::filesystem::rename(daemon.socket(), daemon.socket() + ".old");
    const HttpReply reply = client.get("/v1/doctor");
    EXPECT_THAT(reply.body, HasSubstr("has been removed: new clients do not reach this daemon"));
    std::filesystem::rename(daemon.socket() + ".old", daemon.socket());
}

TEST_F(Doctor, DaemonAndWorkerAreNamedWithTheirProcesses) {
    EXPECT_THAT(check("daemon").text("found"), HasSubstr("process " + std::to_string(daemon.pid())));
    EXPECT_THAT(check("daemon").text("found"), HasSubstr("Release " ADMINHOST_RELEASE));
    EXPECT_THAT(check("worker").text("found"), HasSubstr(std::to_string(daemon.workerPid())));
}

TEST_F(Doctor, FrontAnswersWhileAnotherOperationHangs) {
    UnixHttp busy = startSleeping(daemon, 40'000);
    const auto before = std::chrono::steady_clock::now();
    const Dictionary found = check("checks of the worker");
    EXPECT_LT(std::chrono::steady_clock::now() - before, std::chrono::seconds(38));
    EXPECT_THAT(found.text("found"), HasSubstr("The worker is busy with another request."));
    ::kill(daemon.workerPid(), SIGKILL);
}

TEST(DoctorWithoutWorker, FrontsChecksAreAnsweredWithTheReason) {
    DaemonProcess::Options options;
    options.arguments = {"--plugin", pluginFile("fixture_crashing_later")};
    const DaemonProcess daemon(options);
    const HttpReply reply = daemon.connect().get("/v1/doctor");
    EXPECT_EQ(reply.status, 200);
    EXPECT_THAT(reply.body, HasSubstr(R"("name":"worker","state":"failure")"));
    EXPECT_THAT(reply.body, HasSubstr(R"("name":"socket","state":"ok")"));
    EXPECT_THAT(reply.body, HasSubstr("Local names, the directory and the plug-ins were not checked."));
}

}  // namespace
}  // namespace adminhost::test
