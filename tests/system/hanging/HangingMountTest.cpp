// Requests and tools while a file system hangs.

#include "tests/support/DaemonProcess.h"
#include "tests/support/Eventually.h"
#include "tests/support/OwnMounts.h"
#include "tests/support/SampleRoot.h"
#include "tests/system/host/Host.h"

#include <algorithm>
#include <atomic>
#include <chrono>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <memory>
#include <stdexcept>
#include <string>
#include <system_error>
#include <thread>
#include <utility>
#include <vector>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <linux/fuse.h>
#include <poll.h>
#include <sys/mount.h>
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

/// A file system whose server reads requests and replies to the first one only, which is the kernel's own: a process
/// that waits cannot even be killed until the object is destroyed.
class UnkillableMount {
  public:
    explicit UnkillableMount(std::string place)
        : _place(std::move(place)), _server(::open("/dev/fuse", O_RDWR | O_CLOEXEC)) {
        std::filesystem::create_directories(_place);
        const std::string options = "fd=" + std::to_string(_server) + ",rootmode=40000,user_id=0,group_id=0";
        if (::mount("unkillable", _place.c_str(), "fuse", MS_NOSUID | MS_NODEV, options.c_str()) != 0) {
            throw std::runtime_error("a file system in user space cannot be mounted: " +
                                     std::generic_category().message(errno));
        }
        _thread = std::thread([this] { serve(); });
    }
    UnkillableMount(const UnkillableMount&) = delete;
    UnkillableMount& operator=(const UnkillableMount&) = delete;
    ~UnkillableMount() {
        _ended = true;
        _thread.join();
        ::umount2(_place.c_str(), MNT_DETACH);
        ::close(_server);  // ends every wait
    }
    /// Returns true if a process waits.
    [[nodiscard]] bool isWaitedFor() const { return _requests > 0; }

  private:
    void serve() {
        std::vector<char> buffer(std::size_t{1} << 18U);
        while (!_ended) {
            pollfd entry{_server, POLLIN, 0};
            if (::poll(&entry, 1, 20) <= 0 ||
                ::read(_server, buffer.data(), buffer.size()) < static_cast<ssize_t>(sizeof(fuse_in_header))) {
                continue;
            }
            fuse_in_header header{};
            std::memcpy(&header, buffer.data(), sizeof header);
            if (header.opcode != FUSE_INIT) {
                ++_requests;
                continue;
            }
            fuse_init_in asked{};
            std::memcpy(&asked, buffer.data() + sizeof header, std::min<std::size_t>(sizeof asked, header.len));
            struct {
                fuse_out_header header;
                fuse_init_out body;
            } reply{};
            reply.header = {sizeof reply, 0, header.unique};
            reply.body.major = asked.major;
            reply.body.minor = asked.minor;
            reply.body.max_write = 4096;
            EXPECT_EQ(::write(_server, &reply, sizeof reply), static_cast<ssize_t>(sizeof reply));
        }
    }

    std::string _place;
    int _server;
    std::atomic<bool> _ended = false;
    std::atomic<int> _requests = 0;
    std::thread _thread;
};

/// The state of a process in one letter; empty if it has been reaped.
std::string stateOf(pid_t pid) {
    std::ifstream file("/proc/" + std::to_string(pid) + "/stat");
    std::string text;
    std::getline(file, text);
    const std::size_t end = text.rfind(") ");
    return end == std::string::npos ? "" : text.substr(end + 2, 1);
}

TEST(HangingFileSystem, ToolsOfAWorkerThatCannotBeKilledAreKilled) {
    const SampleRoot root;
    const DaemonProcess daemon({{"--root", root.path(), "--plugin", pluginFile("fixture_good")}, "", {}, true, {}});
    const std::string place = root.disk("/mnt/dead");
    auto dead = std::make_unique<UnkillableMount>(place);
    const std::string id = "01234567-89ab-cdef-0123-456789abcdef";
    const std::string file = root.disk("/tool");
    const pid_t worker = daemon.workerPid();
    UnixHttp client(daemon.socket(), margin);
    client.begin("POST", "/v1/fixture/runAndVisit",
                 R"({"script": "echo $$ >)" + file + R"(.new; mv )" + file + ".new " + file +
                     R"(; exec sleep 300", "path": ")" + place + "\"}",
                 {"Request-Id: " + id});
    ASSERT_TRUE(eventually([&] { return dead->isWaitedFor() && std::filesystem::exists(file); }, margin));
    pid_t tool = 0;
    std::ifstream(file) >> tool;
    ASSERT_GT(tool, 0);
    EXPECT_EQ(daemon.connect().request("DELETE", "/v1/requests/" + id).status, 200);
    EXPECT_EQ(client.reply().status, 503);
    EXPECT_TRUE(eventually(
        [&] {
            const std::string state = stateOf(tool);
            return state.empty() || state == "Z";
        },
        margin))
        << "its worker cannot reap it";
    EXPECT_NE(stateOf(worker), "") << "the test shows nothing if the worker could be killed";
    dead.reset();
    EXPECT_TRUE(eventually([&] { return stateOf(worker).empty(); }, margin));
}

}  // namespace
}  // namespace adminhost::test

int main(int argc, char** argv) {
    adminhost::test::enterOwnMounts(argc, argv);
    testing::InitGoogleTest(&argc, argv);
    return RUN_ALL_TESTS();
}
