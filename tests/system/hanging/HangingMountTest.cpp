// The state of the service while the shared file system hangs.

#include "tests/support/DaemonProcess.h"
#include "tests/support/OwnMounts.h"
#include "tests/support/SampleRoot.h"

#include <chrono>
#include <csignal>
#include <filesystem>
#include <memory>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

using Clock = std::chrono::steady_clock;
using testing::HasSubstr;

constexpr auto ownLimit = std::chrono::seconds(60);
constexpr auto margin = std::chrono::seconds(60);

TEST(HangingSharedFileSystem, EndsTheRequestAtItsTimeLimitWhileTheFrontReplies) {
    const SampleRoot root;
    root.write("/Library/Preferences/com.brenn.lumioserverd.plist",
               "<plist><dict><key>shared_filesystem</key><string>/mnt/media</string></dict></plist>");
    std::filesystem::create_directories(root.disk("/mnt/media"));
    const DaemonProcess daemon(
        {{"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"}, "", {}, true, {}});
    EXPECT_EQ(daemon.connect().post("/v1/lumio/getState").status, 200);
    auto hanging = std::make_unique<HangingMount>(root.disk("/mnt/media"));
    EXPECT_EQ(daemon.connect().post("/v1/lumio/getState").status, 200)
        << "without details, the shared file system is not used";

    UnixHttp client(daemon.socket(), ownLimit + margin);
    const auto start = Clock::now();
    client.begin("POST", "/v1/lumio/getState", R"({"variant":"withDetails"})");
    UnixHttp second(daemon.socket(), 2 * (ownLimit + margin));
    while (daemon.connect().get("/v1/").body.find("\"running\"") == std::string::npos) {
        ASSERT_LT(Clock::now() - start, margin) << "the request does not run";
    }
    second.begin("POST", "/v1/lumio/getState", R"({"variant":"withDetails"})");
    EXPECT_THAT(daemon.connect().get("/v1/").body, HasSubstr("getState"));

    // As a check that was interrupted would leave it.
    const std::string cache = root.disk("/var/lumio/server/adminhostd_krb_cc");
    root.write("/var/lumio/server/adminhostd_krb_cc", "tickets");
    EXPECT_EQ(client.reply().status, 504);
    EXPECT_GE(Clock::now() - start, ownLimit);
    EXPECT_LT(Clock::now() - start, ownLimit + margin);
    const auto end = Clock::now();
    while (std::filesystem::exists(cache) && Clock::now() - end < margin) {
        ::usleep(10'000);
    }
    EXPECT_FALSE(std::filesystem::exists(cache)) << "the next worker removes it although the file system hangs still";
    hanging.reset();
    const HttpReply reply = second.reply();
    EXPECT_EQ(reply.status, 200) << reply.body;
    EXPECT_THAT(reply.body, HasSubstr("\"sharedFileSystemPath\":\"/mnt/media\""));
}

TEST(HangingSharedFileSystem, DoesNotKeepANewWorkerFromReadsThatDoNotUseIt) {
    const SampleRoot root;
    root.write("/Library/Preferences/com.brenn.lumioserverd.plist",
               "<plist><dict><key>shared_filesystem</key><string>/mnt/media</string></dict></plist>");
    std::filesystem::create_directories(root.disk("/mnt/media"));
    const DaemonProcess daemon(
        {{"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"}, "", {}, true, {}});
    const HangingMount hanging(root.disk("/mnt/media"));
    const pid_t first = daemon.workerPid();
    ASSERT_EQ(::kill(first, SIGKILL), 0);
    ASSERT_TRUE(daemon.waitForLog("was killed by signal 9"));
    EXPECT_EQ(daemon.connect().post("/v1/lumio/getState").status, 200);
}

}  // namespace
}  // namespace adminhost::test

int main(int argc, char** argv) {
    adminhost::test::enterOwnMounts(argc, argv);
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
