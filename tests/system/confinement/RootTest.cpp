// With --root nothing outside the root is touched: the daemon runs in a mount namespace in which all file systems are
// read-only, except the root and the directory of the test. What would leave the root fails there.

#include "adminhostd/WriteLock.h"
#include "platform/files/Path.h"
#include "platform/json/Json.h"
#include "platform/value/ValueText.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"

#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

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
using testing::IsEmpty;
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
    /// The descriptions of the commands whose access class fits.
    [[nodiscard]] static std::vector<Dictionary> commandsThat(const test::DaemonProcess& daemon,
                                                              bool (*fits)(std::string_view access)) {
        std::vector<Dictionary> commands;
        const auto described = parseJson(daemon.connect().get("/v1/lumio").body);
        EXPECT_TRUE(described && described->array() != nullptr);
        for (const Value& command : described && described->array() != nullptr ? *described->array() : Array()) {
            if (fits(command.dictionary()->text("access"))) {
                commands.push_back(*command.dictionary());
            }
        }
        return commands;
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

TEST_F(Root, WriteIsServedWithoutTouchingWhatIsOutside) {
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

TEST_F(Root, EveryReadingCommandIsServedWithoutTouchingWhatIsOutside) {
    const test::SampleRoot root;
    const test::DaemonProcess daemon(options(root));
    const std::vector<Dictionary> commands =
        commandsThat(daemon, [](std::string_view access) { return access == "read"; });
    ASSERT_THAT(commands, Not(IsEmpty()));
    for (const Dictionary& command : commands) {
        const std::string name = textOf(command.get("name"));
        SCOPED_TRACE(name);
        const std::string example = jsonOf(command.at("example.request"));
        for (const std::string& body :
             {std::string("{}"), example, std::string(R"({"optionalArguments":{"languages":["de","en"]}})"),
              std::string(R"({"optionalArguments":{"variant":"getConfig","languages":["fr"]}})")}) {
            const test::HttpReply reply = daemon.connect().post("/v1/lumio/" + name, body);
            EXPECT_LT(reply.status, 300) << reply.body;
            const auto answer = parseJson(reply.body);  // an empty body is not JSON
            const Dictionary* dictionary = answer ? answer->dictionary() : nullptr;
            if (dictionary != nullptr && dictionary->contains("readStatus")) {
                EXPECT_EQ(dictionary->get("readStatus"), Value(0)) << reply.body;
            }
        }
    }
    for (const char* address : {"/v1/", "/v1/lumio", "/v1/lumio/history", "/v1/directory", "/v1/directory?match=an",
                                "/v1/directory?is=anna", "/v1/directory?is=editors"}) {
        EXPECT_EQ(daemon.connect().get(address).status, 200) << address;
    }
    EXPECT_THAT(daemon.connect().get("/v1/directory?is=anna").body, HasSubstr("\"shortName\":\"anna\""));
    EXPECT_THAT(daemon.log(), Not(HasSubstr("Read-only file system")));
}

/// Every verb of the command line, and writes that it has no verb for. Everything that may change is below the root.
TEST_F(Root, EveryKindOfChangeIsMadeBelowTheRoot) {
    for (const char* path : {"/Library/SorvaneProducer/Shared", "/elsewhere/media", "relative/media"}) {
        SCOPED_TRACE(path);
        const test::SampleRoot root;
        const std::string shared = path[0] == '/' ? path : "/" + std::string(path);
        if (shared != "/Library/SorvaneProducer/Shared") {
            fs::create_directories(fs::path(root.disk(shared)).parent_path());
            fs::rename(root.sharedFilesystemPath(), root.disk(shared));
            useSharedFilesystem(root, path);
        }
        const test::DaemonProcess daemon(options(root));
        const auto run = [&](std::vector<std::string> words, const std::string& expected = "", int status = 0) {
            words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon.socket()});
            const test::ProgramResult result = test::runProgram(words, test::Errors::merge);
            EXPECT_EQ(result.status, status) << words[3] << ": " << result.output;
            EXPECT_THAT(result.output, HasSubstr(expected));
            return result.output;
        };
        const fs::path file = writable / "state.toml";
        const fs::path secret = writable / "secret";
        std::ofstream(secret) << "planted secret";
        run({"export", file});
        run({"settings", "set", "server_port", "9001"}, "9001");
        run({"settings", "set", "nimbo_grid_id", "seven"}, "seven");
        run({"settings", "set", "nimbo_client_password", "@" + secret.string()}, "(secret)");
        EXPECT_THAT(run({"history"}), HasSubstr("9001"));
        run({"rollback", "1"}, "9001");
        run({"property", "set", "confined", "plain value"}, "plain value");
        run({"property", "set", "confined", "--protect"}, "protect");
        run({"property", "set", "confined", "@" + secret.string()}, "(secret)");
        run({"property", "set", "confined", "--no-protect"}, "protect");
        run({"property", "list"}, "confined");
        run({"camera", "access", "Main hall", "off"}, "access_control");
        run({"camera", "access", "Main hall", "on"}, "access_control");
        run({"camera", "allow", "Main hall", "ben"}, "(not allowed) -> (allowed)");
        run({"camera", "deny", "Main hall", "ben"}, "(allowed) -> (not allowed)");
        run({"whois", "anna"}, "anna");
        run({"settings", "set", "nimbo_grid_id", "eight"}, "eight");
        run({"plan", file}, "eight");
        run({"apply", file}, "eight");
        run({"plan", file}, "no change");
        run({"property", "remove", "confined"}, "confined");
        run({"camera", "remove", "Main hall"}, "Main hall");
        run({"camera", "list"});
        run({"workflow", "list"});
        run({"daemon"}, "release");
        run({"status"}, "stopped", 3);
        EXPECT_THAT(root.read(shared + "/Server/cluster_preferences.plist"), Not(HasSubstr("eight")));
        EXPECT_THAT(daemon.log(), Not(HasSubstr("Read-only file system")));
    }
}

TEST_F(Root, OtherCommandsTouchNothingOutsideWhetherTheySucceedOrFail) {
    const test::SampleRoot root;
    const test::DaemonProcess daemon(options(root));
    const std::vector<Dictionary> commands =
        commandsThat(daemon, [](std::string_view access) { return access != "read"; });
    ASSERT_THAT(commands, Not(IsEmpty()));
    for (const Dictionary& command : commands) {
        const std::string name = textOf(command.get("name"));
        SCOPED_TRACE(name);
        const test::HttpReply reply = daemon.connect().post("/v1/lumio/" + name, jsonOf(command.at("example.request")));
        EXPECT_LT(reply.status, 300) << reply.body;
        EXPECT_THAT(reply.body, Not(HasSubstr("Read-only file system")));
    }
    EXPECT_THAT(daemon.log(), Not(HasSubstr("Read-only file system")));
}

TEST_F(Root, MoveToAnotherSharedFilesystemAndMemberIsMadeBelowTheRoot) {
    const test::SampleRoot root;
    const test::DaemonProcess daemon(options(root));
    const Dictionary answer =
        post(daemon, "writeSettings",
             R"({"configuration":{"shared_filesystem":"/moved/media","member_uuid":"M-2","nimbo_grid_id":"moved"}})");
    EXPECT_EQ(answer.get("writeStatus"), Value(0)) << textOf(Value(answer));
    EXPECT_THAT(root.read("/moved/media/Server/cluster_preferences.plist"), HasSubstr("moved"));
    EXPECT_EQ(
        daemon.connect().post("/v1/lumio/writeSettings", R"({"configuration":{"shared_filesystem":"media"}})").status,
        422)
        << "a relative one is rejected";
    EXPECT_THAT(daemon.log(), Not(HasSubstr("Read-only file system")));
}

TEST_F(Root, FullOrReadOnlyRunDirectoryStopsNoChange) {
    const test::SampleRoot root;
    const std::string run = root.disk("/run");
    fs::create_directories(run);
    ASSERT_EQ(::mount("none", run.c_str(), "tmpfs", 0, "size=64k,nr_inodes=16"), 0) << std::strerror(errno);
    {
        const test::DaemonProcess daemon(options(root));
        const auto write = [&](int port) {
            const Dictionary answer =
                post(daemon, "writeSettings", R"({"configuration":{"server_port":)" + std::to_string(port) + "}}");
            EXPECT_EQ(answer.get("writeStatus"), Value(0)) << textOf(Value(answer));
            EXPECT_EQ(answer.at("configuration.server_port"), Value(port));
        };
        write(9001);
        for (int i = 0; i < 64; ++i) {
            std::ofstream(run + "/" + std::to_string(i)) << std::string(std::size_t{8} << 10U, 'x');
        }
        ASSERT_FALSE(std::ofstream(run + "/one more").is_open()) << "there is room for a file";
        write(9002);
        ASSERT_EQ(::mount(nullptr, run.c_str(), nullptr, MS_REMOUNT | MS_RDONLY, nullptr), 0) << std::strerror(errno);
        write(9003);
        const std::string before = systemRoot();
        setSystemRoot(root.path());
        {
            const auto held = WriteLock::tryToHold();
            ASSERT_TRUE(held) << textOf(held.error());
            const auto second = WriteLock::tryToHold();
            ASSERT_FALSE(second) << "two hold it";
            EXPECT_EQ(second.error().domain, WriteLock::busy);
        }
        setSystemRoot(before);
    }
    ::umount2(run.c_str(), MNT_DETACH);
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
