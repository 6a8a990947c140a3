// With --root nothing outside the root is touched: the daemon runs in a mount namespace in which all file systems are
// read-only, except the root and the directory of the test. What would leave the root fails there.

#include "platform/json/Json.h"
#include "platform/value/ValueText.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/SampleRoot.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sched.h>
#include <sys/mount.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::Not;

constexpr const char* allow =
    "; this test needs user namespaces: allow them (sysctl kernel.unprivileged_userns_clone=1 and "
    "kernel.apparmor_restrict_unprivileged_userns=0, in a container --security-opt seccomp=unconfined or --cap-add "
    "SYS_ADMIN)";

/// The directory of everything that may change, created and removed outside the namespace.
fs::path writable;
/// The reason why the namespace could not be created.
std::string problem;

std::string failed(const char* step) {
    return std::string(step) + ": " + std::strerror(errno) + allow;
}

/// Moves this process into namespaces of its own. Returns the name of the failed step; empty on success.
std::string enterReadOnlyNamespace() {
    const std::string uid = "0 " + std::to_string(::geteuid()) + " 1";
    const std::string gid = "0 " + std::to_string(::getegid()) + " 1";
    if (::unshare(CLONE_NEWUSER | CLONE_NEWNS) != 0) {
        return failed("unshare(CLONE_NEWUSER | CLONE_NEWNS)");
    }
    for (const auto& [file, text] : {std::pair{"setgroups", std::string("deny")}, {"uid_map", uid}, {"gid_map", gid}}) {
        std::ofstream map(std::string("/proc/self/") + file);
        map << text;
        if (!map.flush()) {
            return failed(file);
        }
    }
    if (::mount(nullptr, "/", nullptr, MS_REC | MS_PRIVATE, nullptr) != 0 ||
        ::mount(writable.c_str(), writable.c_str(), nullptr, MS_BIND, nullptr) != 0) {
        return failed("mount");
    }
    mount_attr readOnly{};
    readOnly.attr_set = MOUNT_ATTR_RDONLY;
    if (::mount_setattr(AT_FDCWD, "/", AT_RECURSIVE, &readOnly, sizeof readOnly) != 0) {
        return failed("mount_setattr");
    }
    mount_attr readWrite{};
    readWrite.attr_clr = MOUNT_ATTR_RDONLY;
    if (::mount_setattr(AT_FDCWD, writable.c_str(), 0, &readWrite, sizeof readWrite) != 0) {
        return failed("mount_setattr");
    }
    ::setenv("TMPDIR", writable.c_str(), 1);
    return {};
}

class Root : public testing::Test {
  protected:
    void SetUp() override {
        ASSERT_EQ(problem, "");
        ASSERT_FALSE(std::ofstream("/written-by-a-test").is_open()) << "the file system outside can be written";
    }
    [[nodiscard]] static test::DaemonProcess::Options options(const test::SampleRoot& root) {
        test::DaemonProcess::Options options;
        options.arguments = {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"};
        return options;
    }
    [[nodiscard]] static Dictionary post(const test::DaemonProcess& daemon, const std::string& command,
                                         const std::string& body) {
        const test::HttpReply reply = daemon.connect().post("/v1/lumio/" + command, body);
        EXPECT_EQ(reply.status, 200) << reply.body;
        const auto value = parseJson(reply.body);
        return value && value->dictionary() != nullptr ? *value->dictionary() : Dictionary();
    }
    /// The sample's identity preferences with another shared file system.
    static void useSharedFilesystem(const test::SampleRoot& root, const std::string& path) {
        const std::string file = "/Library/Preferences/com.brenn.lumioserverd.plist";
        std::string text = root.read(file);
        const std::string old = "<string>/Library/SorvaneProducer/Shared</string>";
        const std::size_t at = text.find(old);
        ASSERT_NE(at, std::string::npos);
        root.write(file, text.replace(at, old.size(), "<string>" + path + "</string>"));
    }
};

TEST_F(Root, EveryKindOfRequestIsServedWithoutTouchingWhatIsOutside) {
    const test::SampleRoot root;
    const test::DaemonProcess daemon(options(root));
    const Dictionary answer = post(daemon, "writeSettings",
                                   R"({"configuration":{"server_port":9001,"nimbo_client_password":"x",)"
                                   R"("properties":[{"_newid_":true,"name":"n","value":"v","protect":true}]}})");
    EXPECT_EQ(answer.get("writeStatus"), Value(0)) << textOf(Value(answer));
    EXPECT_EQ(answer.at("configuration.server_port"), Value(9001));
    EXPECT_EQ(root.sql("select count(*) from properties where name='n'"), "1\n");
    EXPECT_THAT(daemon.log(), Not(HasSubstr("Read-only file system")));
}

TEST_F(Root, RelativeSharedFilesystemAndStepsUpLeadBelowTheRoot) {
    for (const char* path : {"relative/media", "/../../media", "../media"}) {
        SCOPED_TRACE(path);
        const test::SampleRoot root;
        useSharedFilesystem(root, path);
        const test::DaemonProcess daemon(options(root));
        fs::create_directories(root.disk("/relative/media/Server"));
        fs::create_directories(root.disk("/media/Server"));
        const Dictionary answer = post(daemon, "writeSettings", R"({"configuration":{"nimbo_grid_id":"seven"}})");
        EXPECT_EQ(answer.get("writeStatus"), Value(0)) << textOf(Value(answer));
        const std::string server = path[0] == 'r' ? "/relative/media/Server" : "/media/Server";
        EXPECT_THAT(root.read(server + "/cluster_preferences.plist"), HasSubstr("seven"));
    }
}

}  // namespace
}  // namespace adminhost

int main(int argc, char** argv) {
    testing::InitGoogleTest(&argc, argv);
    std::string pattern = std::filesystem::temp_directory_path() / "confined.XXXXXX";
    if (::mkdtemp(pattern.data()) == nullptr) {
        return 1;
    }
    adminhost::writable = pattern;
    const pid_t child = ::fork();
    if (child == 0) {
        adminhost::problem = adminhost::enterReadOnlyNamespace();
        return RUN_ALL_TESTS();
    }
    int status = 1;
    ::waitpid(child, &status, 0);
    std::filesystem::remove_all(pattern);
    return WIFEXITED(status) ? WEXITSTATUS(status) : 1;
}
