// Failures between the command line and the service of another machine, each with its exit status and what to do.

#include "tests/support/Eventually.h"
#include "tests/support/RunningProgram.h"
#include "tests/system/remote/RemoteService.h"

#include <algorithm>
#include <csignal>
#include <filesystem>
#include <fstream>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;

class RemoteFailures : public RemoteService {
  protected:
    void expectFailure(int status, const testing::Matcher<const std::string&>& output) const {
        const ProgramResult result = remote({"settings", "get", "server_port"});
        EXPECT_EQ(result.status, status) << result.output;
        EXPECT_THAT(result.output, output);
    }
    [[nodiscard]] std::size_t writes() const {
        const std::vector<ToolCall> calls = root.toolCalls();
        return static_cast<std::size_t>(std::count_if(calls.begin(), calls.end(), [](const ToolCall& call) {
            return call.tool.ends_with("setup_lumioserverd_library");
        }));
    }
};

TEST_F(RemoteFailures, ServerThatIsNotThereIsUnreachable) {
    server.stop();
    expectFailure(8, AllOf(HasSubstr("port "), HasSubstr("Connection refused\n"),
                           HasSubstr("adminhostctl: studio cannot be reached: ssh ended with status 255\n")));
}

TEST_F(RemoteFailures, UnknownHostKeyIsUnreachable) {
    server.forgetHostKey();
    expectFailure(8, AllOf(HasSubstr("Host key verification failed.\n"), HasSubstr("studio cannot be reached")));
}

TEST_F(RemoteFailures, RefusedLoginIsUnreachable) {
    server.forgetUserKey();
    expectFailure(8, AllOf(HasSubstr("Permission denied (publickey)"), HasSubstr("studio cannot be reached")));
}

TEST_F(RemoteFailures, MissingCommandLineThereIsNamed) {
    server.installThere("adminhostctl", "echo 'sh: adminhostctl: not found' >&2; exit 127\n");
    expectFailure(8, AllOf(HasSubstr("sh: adminhostctl: not found\n"),
                           HasSubstr("adminhostctl is not found on studio; install the release ")));
}

TEST_F(RemoteFailures, OlderCommandLineThereIsNamed) {
    server.installThere("adminhostctl", "echo \"adminhostctl: command not found: $1\" >&2; exit 2\n");
    expectFailure(8, AllOf(HasSubstr("command not found: bridge\n"),
                           HasSubstr("studio has no verb \"bridge\", or rejected its arguments: ")));
}

TEST_F(RemoteFailures, OlderDaemonThereIsNamed) {
    server.installThere("adminhostctl",
                        "printf 'adminhostctl bridge\\n'; read -r line\n"
                        "printf 'HTTP/1.1 200 OK\\r\\nContent-Length: 33\\r\\n\\r\\n'\n"
                        "printf '{\"interface\":0,\"release\":\"0.0.9\"}'; cat >/dev/null\n");
    expectFailure(1, HasSubstr("the daemon at studio has the release 0.0.9, which is too old for this adminhostctl; "
                               "install the release "));
}

TEST_F(RemoteFailures, DaemonThatIsNotRunningThereIsReportedFromThere) {
    server.installThere("adminhostctl", "exec '" + program() + "' --socket /nowhere/socket \"$@\"\n");
    expectFailure(3, AllOf(HasSubstr("the daemon cannot be reached at /nowhere/socket: No such file or directory\n"),
                           HasSubstr("adminhostctl: the daemon of studio cannot be reached\n")));
}

TEST_F(RemoteFailures, ControlCharactersOfTheOtherMachineAreShown) {
    server.installThere("adminhostctl", "printf 'a\\033[31mb\\n' >&2; exit 7\n");
    expectFailure(8, AllOf(HasSubstr("a\\x1b[31mb\n"),
                           HasSubstr("adminhostctl on studio could not be run: it ended with status 7\n")));
}

TEST_F(RemoteFailures, ShellThatPrintsForeverIsEnded) {
    server.installThere("adminhostctl", "exec yes\n");
    expectFailure(8, HasSubstr("studio prints other text before adminhostctl is run"));
}

TEST_F(RemoteFailures, LoginThatHangsEndsWithTheTimeout) {
    server.installThere("adminhostctl", "exec sleep 60\n");
    const ProgramResult result = remote({"--timeout", "3", "settings", "get", "server_port"});
    EXPECT_EQ(result.status, 8);
    EXPECT_THAT(result.output, HasSubstr("studio has not answered within 3 s\n"));
}

TEST_F(RemoteFailures, MissingSshIsNamed) {
    std::vector<std::string> command = remoteCommand({"daemon"});
    std::replace_if(
        command.begin(), command.end(), [](const std::string& word) { return word.starts_with("PATH="); },
        "PATH=/nowhere:relative");
    const ProgramResult result = runProgram(command, Errors::merge, "");
    EXPECT_EQ(result.status, 8);
    EXPECT_EQ(result.output, "adminhostctl: ssh is not installed; install the package openssh-client\n");
}

TEST_F(RemoteFailures, DoctorChecksNothingOfThisMachine) {
    server.stop();
    const ProgramResult result = remote({"doctor"});
    EXPECT_EQ(result.status, 3);
    EXPECT_THAT(result.output, AllOf(HasSubstr("studio cannot be reached"), Not(HasSubstr("socket"))));
}

TEST_F(RemoteFailures, WriteWhoseConnectionBreaksIsLookedUpOverANewOneAndNotRepeated) {
    root.recordToolCalls();
    holdWrite();
    RunningProgram set(remoteCommand({"settings", "set", "server_port", "8180"}));
    waitForWrite();
    server.breakSessions();
    set.waitFor("the connection to the daemon was lost");
    releaseWrite();
    const ProgramResult result = set.wait();
    EXPECT_EQ(result.status, 0) << result.output;
    EXPECT_THAT(result.output, AllOf(HasSubstr("the connection to the daemon was lost: ssh ended with status 255\n"),
                                     HasSubstr("has ended; it was not repeated"),
                                     HasSubstr("settings.server_port: 8170 -> 8180: applied\n")));
    EXPECT_EQ(writes(), 1U);
}

TEST_F(RemoteFailures, FollowedLogGoesOnOnceALoginSucceedsAgain) {
    const std::filesystem::path log = root.path() + "/Library/Logs/lumioserverd/startup.log";
    std::filesystem::create_directories(log.parent_path());
    std::ofstream(log) << "first\n";
    RunningProgram follow(remoteCommand({"logs", "--follow", "startup_log"}));
    follow.waitFor("first\n");
    server.forgetUserKey();
    server.breakSessions();
    follow.waitFor("trying again");
    const std::size_t logins = server.calls().size();
    EXPECT_TRUE(eventually([&] { return server.calls().size() > logins + 1; }, std::chrono::seconds(30)))
        << "a login that fails is tried again";
    server.knowUserKey();
    std::ofstream(log, std::ios::app) << "second\n";
    follow.waitFor("second\n");
    follow.signal(SIGTERM);
    EXPECT_EQ(follow.wait().status, 128 + SIGTERM);
}

TEST_F(RemoteFailures, WriteWhoseMachineIsGoneIsUndetermined) {
    holdWrite();
    RunningProgram set(remoteCommand({"settings", "set", "server_port", "8180"}));
    waitForWrite();
    server.stop();
    const ProgramResult result = set.wait();
    releaseWrite();
    EXPECT_EQ(result.status, 6) << result.output;
    EXPECT_THAT(result.output, AllOf(HasSubstr("cannot be looked up: the daemon cannot be reached"),
                                     HasSubstr("settings.server_port: 8170 -> 8180: not determined\n")));
    EXPECT_THAT(result.output, Not(ContainsRegex("Connection refused[^$]*Connection refused"))) << "printed once";
    EXPECT_TRUE(eventually(
        [&] {
            return ctl({"settings", "get", "server_port"}).output == "8180\n";
        },
        std::chrono::seconds(30)))
        << "a change that has begun is finished";
}

TEST_F(RemoteFailures, SshThatIsKilledInAWriteIsLookedUpToo) {
    holdWrite();
    RunningProgram set(remoteCommand({"settings", "set", "server_port", "8180"}));
    waitForWrite();
    EXPECT_EQ(runProgram({"pkill", "-KILL", "-f", server.toolDirectory().parent_path().string() + "/config"}).status,
              0);
    set.waitFor("the connection to the daemon was lost");
    releaseWrite();
    const ProgramResult result = set.wait();
    EXPECT_EQ(result.status, 0) << result.output;
    EXPECT_THAT(result.output, AllOf(HasSubstr("the connection to the daemon was lost: ssh ended with status 137\n"),
                                     HasSubstr("settings.server_port: 8170 -> 8180: applied\n")));
}

TEST_F(RemoteFailures, InterruptedWriteIsReportedAndTheProgramEndsByTheSignal) {
    holdWrite();
    RunningProgram set(remoteCommand({"settings", "set", "server_port", "8180"}));
    waitForWrite();
    set.signal(SIGINT);
    set.waitFor("interrupted");
    releaseWrite();
    const ProgramResult result = set.wait();
    EXPECT_EQ(result.status, 128 + SIGINT) << result.output;
    EXPECT_THAT(result.output, AllOf(HasSubstr("interrupted"), HasSubstr("has ended; it was not repeated"),
                                     HasSubstr("settings.server_port: 8170 -> 8180: applied\n")));
}

}  // namespace
}  // namespace adminhost::test
