// The check of the grid controller through daemon, worker, KDC and tools: its outcome, its ticket cache, and where its
// password must not be. The stand-in for the grid tool asks the KDC for a ticket with the cache that it is given.

#include "tests/support/DaemonProcess.h"
#include "tests/support/Eventually.h"
#include "tests/support/Kdc.h"
#include "tests/support/SampleRoot.h"
#include "tests/system/secrets/Searches.h"

#include <algorithm>
#include <chrono>
#include <csignal>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::ElementsAre;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::Not;

constexpr const char* details = R"({"variant":"withDetails"})";
constexpr const char* cacheFile = "/var/lumio/server/adminhostd_krb_cc";
constexpr auto patience = std::chrono::seconds(60);

support::Kdc& realm() {
    static const std::unique_ptr<support::Kdc> kdc = [] {
        auto started = std::make_unique<support::Kdc>();
        started->admin(std::string("addprinc -pw ") + planted +
                       " lumiogrid\naddprinc -randkey nimbo/grid1.example.org\n");
        return started;
    }();
    return *kdc;
}

class GridCheck : public testing::Test {
  protected:
    void SetUp() override {
        root.write("/etc/demo/nimbo.service", "nimbo/grid1.example.org");
        root.recordToolCalls();
        // Only the superuser can give the test file to another account.
        root.write("/etc/passwd", "lumiogrid:x:" + std::to_string(::geteuid()) + ":0::/var/empty:/bin/sh\n");
        daemon.emplace(DaemonProcess::Options{
            {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"},
            "[[directory.node]]\nname = \"/Local\"\nkind = \"local\"\nkerberos_realm = \"NIMBO.TEST\"\n",
            {},
            true,
            {}});
    }
    void TearDown() override {
        EXPECT_FALSE(fs::exists(root.disk(cacheFile))) << "no ticket is left";
        for (const fs::path& directory : {fs::path(root.directory()), daemon->directory()}) {
            EXPECT_THAT(searchBelow(directory).holding, IsEmpty());
        }
        checkProcesses();
    }
    void checkProcesses() const {
        const auto processes = processesFrom(daemon->pid());
        EXPECT_GE(processes.size(), 2U);
        for (const pid_t pid : processes) {
            EXPECT_FALSE(holdsPlanted(argumentsAndEnvironmentOf(pid))) << pid;
        }
    }

    /// The answer, which like the daemon's record of the request must not show the password.
    [[nodiscard]] HttpReply post(const std::string& command, const std::string& body) const {
        HttpReply reply = UnixHttp(daemon->socket(), patience).post("/v1/lumio/" + command, body);
        EXPECT_FALSE(holdsPlanted(reply.body)) << reply.body;
        EXPECT_FALSE(holdsPlanted(daemon->connect().get("/v1/requests/" + reply.headers.at("request-id")).body));
        EXPECT_FALSE(holdsPlanted(daemon->connect().get("/v1/lumio/history").body));
        return reply;
    }
    void storePassword(const std::string& password) const {
        EXPECT_EQ(post("writeSettings", R"({"configuration":{"nimbo_client_password":")" + password + "\"}}").status,
                  200);
    }
    [[nodiscard]] static std::string validation(const std::string& password) {
        return R"({"nimbo_client_username":"lumiogrid","nimbo_controller":"grid1.example.org","nimbo_client_password":")" +
               password + R"(","shared_filesystem":"/Library/SorvaneProducer/Shared"})";
    }

    const support::ScopedEnvironment environment{realm().environment()};
    const SampleRoot root;
    std::optional<DaemonProcess> daemon;
};

TEST_F(GridCheck, RightPasswordReachesTheGridAndTheWrongOneDoesNot) {
    storePassword(planted);
    EXPECT_THAT(post("getState", details).body, HasSubstr(R"("nimboControllerState":"kNimboAvailable")"));
    EXPECT_EQ(post("validateSettings", validation(planted)).body, "{\"command\":\"validateSettings\"}\n");
    const ToolCall expected{"/usr/bin/nimbo",
                            {"-h", "grid1.example.org", "-auth", "Kerberos", "-f", "xml", "-grid", "list"},
                            {{"KRB5CCNAME", "FILE:" + root.disk(cacheFile)}}};
    const auto calls = root.toolCalls();
    EXPECT_EQ(std::count(calls.begin(), calls.end(), expected), 2);

    storePassword(std::string(planted) + "x");
    EXPECT_THAT(post("getState", details).body, HasSubstr(R"("nimboControllerState":"kNimboUnavailable")"));
    EXPECT_THAT(post("validateSettings", validation(std::string(planted) + "x")).body,
                HasSubstr(R"("nimbo_controller_error":"kNimboControllerCheckFailedError")"));
}

TEST_F(GridCheck, TwoRequestsForDetailsAtOnceBothReachTheGrid) {
    storePassword(planted);
    UnixHttp first(daemon->socket(), patience);
    UnixHttp second(daemon->socket(), patience);
    first.begin("POST", "/v1/lumio/getState", details);
    second.begin("POST", "/v1/lumio/getState", details);
    EXPECT_THAT(first.reply().body, HasSubstr("kNimboAvailable"));
    EXPECT_THAT(second.reply().body, HasSubstr("kNimboAvailable"));
}

TEST_F(GridCheck, TicketsOfAKilledWorkerAreRemovedWhenTheNextOneStarts) {
    storePassword(planted);
    root.setSwitch("nimbo.sleep", "1000");
    UnixHttp client(daemon->socket(), patience);
    client.begin("POST", "/v1/lumio/getState", details);
    ASSERT_TRUE(eventually([&] {
        return fs::exists(root.disk(cacheFile)) && fs::file_size(root.disk(cacheFile)) > 300;
    })) << "the check does not run";
    struct stat status {};
    ASSERT_EQ(::stat(root.disk(cacheFile).c_str(), &status), 0);
    EXPECT_EQ(status.st_mode & 07777U, 0600U);
    checkProcesses();

    const pid_t worker = daemon->workerPid();
    ASSERT_EQ(::kill(worker, SIGKILL), 0);
    EXPECT_EQ(client.reply().status, 500);
    EXPECT_TRUE(eventually([&] { return !fs::exists(root.disk(cacheFile)); }, patience));
    root.clearSwitches();
    root.write("/etc/demo/nimbo.service", "nimbo/grid1.example.org");
    EXPECT_THAT(post("getState", details).body, HasSubstr("kNimboAvailable"));
}

TEST_F(GridCheck, RefusedRequestsAndFailedCreationsShowNothingOfAPassword) {
    EXPECT_EQ(post("validateSettings", validation(planted).insert(1, R"("shared_filesystem":"relative",)")).status,
              400);
    EXPECT_EQ(post("validateSettings",
                   R"({"shared_filesystem":"relative","nimbo_client_password":")" + std::string(planted) + "\"}")
                  .status,
              422);
    const HttpReply reply =
        post("createNimboAccount", R"({"directoryNode":"/Local","directoryUsername":"root","directoryPassword":")" +
                                       std::string(planted) + "\"}");
    EXPECT_EQ(reply.status, 200);
    EXPECT_THAT(reply.body, testing::AllOf(HasSubstr("\"errorCode\":2"), HasSubstr("\"error\":")));
}

TEST_F(GridCheck, GridToolThatPrintsTheCacheNameOrGarbageIsOnlyUnavailable) {
    storePassword(planted);
    for (const char* output : {"\xff\xfe\x01", "", "<plist><dict/></plist>"}) {
        root.setSwitch("nimbo.output", output);
        EXPECT_THAT(post("getState", details).body, HasSubstr("kNimboUnavailable")) << output;
    }
    root.clearSwitches();
    root.setSwitch("nimbo.signal", "SEGV");
    EXPECT_THAT(post("getState", details).body, HasSubstr("kNimboUnavailable"));
    root.remove("/usr/bin/nimbo");
    EXPECT_THAT(post("getState", details).body, HasSubstr("kNimboUnavailable"));
}

}  // namespace
}  // namespace adminhost::test
