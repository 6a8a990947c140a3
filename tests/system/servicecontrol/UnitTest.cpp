// The daemon's own units: what they restrict breaks no command, no tool and no service that is started from the daemon.
//
// As root the daemon runs from the units of this build beside a real systemd. Another account has no systemd that runs
// units for it: there the same requests are made to a daemon without restrictions, and each test prints that it has
// shown nothing about the units.

#include "platform/json/Json.h"
#include "tests/support/AdministratorTree.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Eventually.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"
#include "tests/support/ServiceManager.h"
#include "tests/support/Slapd.h"

#include <csignal>
#include <filesystem>
#include <fstream>
#include <functional>
#include <iostream>
#include <iterator>
#include <optional>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::Not;

constexpr const char* service = "adminhostd.service";
constexpr const char* socketUnit = "adminhostd.socket";
constexpr const char* administratorsPassword = "a password";

std::string textOf(const fs::path& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
}

/// The unit with other lines for some of its keys, so that it runs this build on a sample.
std::string changed(const std::string& unit,
                    const std::function<std::optional<std::string>(const std::string&)>& line) {
    std::istringstream lines(unit);
    std::string result;
    for (std::string one; std::getline(lines, one);) {
        const auto other = line(one.substr(0, one.find('=')));
        result += other.value_or(one) + '\n';
        if (one == "[Unit]") {
            result += "DefaultDependencies=no\n";
        }
    }
    return result;
}

class DaemonUnit : public testing::Test {
  protected:
    void SetUp() override {
        server.add(administratorTree(administratorsPassword));
        fs::create_directory(root.directory() + "/daemon");
        const std::string configuration =
            "service_manager = \"pidfile\"\naccount = \"nobody\"\n[[directory.node]]\nname = "
            "\"/LDAP\"\nuri = [\"" +
            server.localUri() +
            "\"]\nbase = \"dc=nimbo,dc=test\"\ncreate_base = "
            "\"ou=people,dc=nimbo,dc=test\"\nkerberos_realm = \"NIMBO.TEST\"\n"
            "[[directory.node]]\nname = \"/Local\"\nkind = \"local\"\n";
        const std::string plugin = std::string(BINARY_DIR) + "/lib/adminhost_lumio.so";
        if (!isRealServiceManager()) {
            std::cout << "NOT SHOWN: that the units' restrictions break nothing. This needs root, for a systemd of the "
                         "test's own; the daemon runs without them here.\n";
            process.emplace(
                DaemonProcess::Options{{"--root", root.path(), "--plugin", plugin}, configuration, {}, true, {}});
            socket = process->socket();
            return;
        }
        root.write("/etc/adminhostd.toml", configuration);
        socket = root.directory() + "/daemon/socket";
        const std::string command = std::string(BINARY_DIR) + "/bin/adminhostd --root " + root.path() + " --socket " +
                                    socket + " --plugin " + plugin + " --log stderr";
        addUnit(socketUnit, changed(textOf(SOURCE_DIR "/packaging/systemd/adminhostd.socket"),
                                    [&](const std::string& key) -> std::optional<std::string> {
                                        return key == "ListenStream"  ? std::optional("ListenStream=" + socket)
                                               : key == "SocketGroup" ? std::optional<std::string>("SocketGroup=root")
                                                                      : std::nullopt;
                                    }));
        addUnit(service,
                changed(textOf(BINARY_DIR "/generated/packaging/adminhostd.service"),
                        [&](const std::string& key) -> std::optional<std::string> {
                            return key == "ExecStart"
                                       ? std::optional("ExecStart=" + command + "\nStandardError=append:" + log())
                                   : key == "ExecStartPre" ? std::optional("ExecStartPre=-" + command + " --check")
                                                           : std::nullopt;
                        }));
        startUnit(socketUnit);
        ASSERT_TRUE(reachState(socketUnit, "active"));
    }
    void TearDown() override {
        if (isRealServiceManager()) {
            static_cast<void>(runProgram({"systemctl", "stop", socketUnit, service}));
        }
        static_cast<void>(runProgram({root.disk("/usr/sbin/lumioctl"), "server", "stop"}));
    }

    [[nodiscard]] std::string log() const { return root.directory() + "/daemon/log"; }
    [[nodiscard]] UnixHttp client() const { return UnixHttp(socket, std::chrono::seconds(30)); }
    [[nodiscard]] HttpReply post(const std::string& command, const std::string& body = "") const {
        return client().post("/v1/lumio/" + command, body);
    }
    static std::string shown(const char* property) {
        std::string text =
            runProgram({"systemctl", "show", std::string("--property=") + property, "--value", service}).output;
        return text.substr(0, text.find('\n'));
    }

    const SampleRoot root;
    const support::Slapd server;
    std::string socket;
    std::optional<DaemonProcess> process;
};

TEST_F(DaemonUnit, EveryCommandIsServedUnderItsRestrictions) {
    const auto described = parseJson(client().get("/v1/lumio").body);
    ASSERT_TRUE(described && described->array() != nullptr);
    if (isRealServiceManager()) {
        EXPECT_TRUE(reachState(service, "active")) << "by its own notification";
    }
    for (const bool reading : {true, false}) {
        for (const Value& one : *described->array()) {
            const Dictionary& command = *one.dictionary();
            const std::string name(command.text("name"));
            if ((command.text("access") == "read") != reading || name == "createNimboAccount") {
                continue;
            }
            const HttpReply reply = post(name, jsonOf(command.at("example.request")));
            EXPECT_LT(reply.status, 300) << name << ": " << reply.body;
            EXPECT_THAT(reply.body, Not(HasSubstr("not permitted"))) << name;
        }
    }
    if (isRealServiceManager()) {
        EXPECT_THAT(textOf(log()),
                    AllOf(Not(HasSubstr("Operation not permitted")), Not(HasSubstr("Read-only file system"))));
    }
}

TEST_F(DaemonUnit, ReloadReadsTheConfigurationAgain) {
    ASSERT_EQ(client().get("/v1/").status, 200);
    if (isRealServiceManager()) {
        const ProgramResult reloaded = runProgram({"systemctl", "reload", service});
        EXPECT_EQ(reloaded.status, 0) << reloaded.output;
    } else {
        process->signal(SIGHUP);
    }
    const std::string text = "the configuration has been read again";
    EXPECT_TRUE(eventually([&] { return (process ? process->log() : textOf(log())).find(text) != std::string::npos; }))
        << (process ? process->log() : textOf(log()));
    EXPECT_EQ(client().get("/v1/").status, 200);
}

TEST_F(DaemonUnit, AccountIsCreatedAndTheSharedFileSystemChanged) {
    const HttpReply created = post("createNimboAccount", std::string(R"({"directoryNode":"/LDAP",)"
                                                                     R"("directoryUsername":"writer",)"
                                                                     R"("directoryPassword":")") +
                                                             administratorsPassword + "\"}");
    EXPECT_EQ(created.status, 200) << created.body;
    EXPECT_THAT(created.body, HasSubstr("\"password\":")) << created.body;
    const HttpReply moved = post("writeSettings", R"({"configuration":{"shared_filesystem":"/moved/media"}})");
    EXPECT_EQ(moved.status, 200) << moved.body;
    EXPECT_THAT(moved.body, HasSubstr(R"("writeStatus":0)"));
    EXPECT_TRUE(fs::exists(root.disk("/moved/media/Server")));
}

TEST_F(DaemonUnit, StopLeavesTheServiceAndTheSocketAndTheNextClientStartsTheDaemonAgain) {
    ASSERT_EQ(post("startService").status, 204);
    pid_t started = 0;
    ASSERT_TRUE(std::ifstream(root.disk("/var/run/lumioserverd.pid")) >> started);
    if (isRealServiceManager()) {
        const std::string main = shown("MainPID");
        EXPECT_THAT(textOf("/proc/" + main + "/comm"), HasSubstr("adminhostd"));
        EXPECT_THAT(textOf("/proc/" + std::to_string(started) + "/cgroup"), HasSubstr(service)) << "it is in the unit";
        for (const auto& [property, expected] : {std::pair("Type", "notify"),
                                                 {"KillMode", "process"},
                                                 {"OOMPolicy", "continue"},
                                                 {"TasksMax", "infinity"},
                                                 {"RuntimeDirectory", ""},
                                                 {"LogRateLimitIntervalUSec", "0"}}) {
            EXPECT_EQ(shown(property), expected) << property;
        }
        ASSERT_EQ(runProgram({"systemctl", "stop", service}).status, 0);
        EXPECT_EQ(shown("Result"), "success");
        EXPECT_TRUE(fs::exists(socket));
    } else {
        process->signal(SIGTERM);
        EXPECT_EQ(process->wait(), 0);
        process.emplace(DaemonProcess::Options{
            {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"},
            "service_manager = \"pidfile\"\n",
            {},
            true,
            {}});
        socket = process->socket();
    }
    EXPECT_EQ(::kill(started, 0), 0) << "the service ended with the daemon";
    EXPECT_THAT(post("getState").body, HasSubstr("RUNNING"));
    const HttpReply stopped = post("stopService");
    EXPECT_EQ(stopped.status, 200);
    EXPECT_THAT(stopped.body, HasSubstr(R"("state":"STOPPED")"));
}

}  // namespace
}  // namespace adminhost::test
