// The command line for the service of another machine.

#include "tests/support/Eventually.h"
#include "tests/support/OnTerminal.h"
#include "tests/system/remote/RemoteService.h"

#include <algorithm>

#include <unistd.h>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::Each;
using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

using RemoteHost = RemoteService;

TEST_F(RemoteHost, WholeJourneyHasTheOutputAndTheStatusesOfTheSameMachine) {
    // Read
    for (const std::vector<std::string>& words : std::vector<std::vector<std::string>>{
             {"settings", "get"},
             {"settings", "get", "server_prt"},
             {"camera", "list", "--format", "json"},
             {"camera", "show", "Main hall", "--format", "json"},
             {"property", "list"},
             {"whois", "anna"},
             {"commands"},
             {"help", "writeSettings"},
             {"getState"},
             {"history"},
         }) {
        const ProgramResult here = ctl(words);
        const ProgramResult there = remote(words);
        EXPECT_EQ(there.output, here.output) << words[0];
        EXPECT_EQ(there.status, here.status) << words[0];
    }
    EXPECT_EQ(remote({"settings", "get", "server_prt"}).status, 2);
    // Write
    const ProgramResult set = remote({"settings", "set", "server_port", "8180"});
    EXPECT_EQ(set.status, 0);
    EXPECT_THAT(set.output, HasSubstr("settings.server_port: 8170 -> 8180: applied\n"));
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8180\n");
    EXPECT_EQ(remote({"settings", "set", "server_port", "many"}).status, 2);
    // Plan and apply, with a file of this machine
    const std::string desired = file("desired.toml", "[settings]\nserver_port = 8190\n");
    const ProgramResult plan = remote({"plan", desired});
    EXPECT_EQ(plan.status, 0);
    EXPECT_THAT(plan.output, HasSubstr("settings.server_port: 8180 -> 8190"));
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8180\n") << "a plan changes nothing";
    EXPECT_EQ(remote({"apply", desired}).status, 0);
    EXPECT_EQ(remote({"settings", "get", "server_port"}).output, "8190\n");
    EXPECT_EQ(remote({"apply", "/missing.toml"}).status, 2);
    // Look back
    const ProgramResult history = remote({"history"});
    EXPECT_THAT(history.output, AllOf(HasSubstr("8170 -> 8180"), HasSubstr("8180 -> 8190")));
    // A failure of the service
    root.setSwitch("lumioctl.exit", "3");
    EXPECT_EQ(remote({"start"}).status, ctl({"start"}).status);
    EXPECT_NE(remote({"start"}).status, 0);
}

TEST_F(RemoteHost, SshIsRunWithTheseArgumentsAndNeverReadsStandardInput) {
    EXPECT_EQ(remote({"settings", "set", "server_port", "@-"}, "8180").status, 0);
    EXPECT_EQ(remote({"--timeout", "20.5", "--socket", daemon.socket(), "settings", "get", "server_port"}, "x").output,
              "8180\n");
    std::vector<std::string> calls = server.calls();
    ASSERT_EQ(calls.size(), 2U) << "one login for each command";
    EXPECT_EQ(calls.back(), "-T -o BatchMode=yes -o ConnectTimeout=21 -- studio adminhostctl --socket " +
                                daemon.socket() + " bridge");
    calls.erase(std::find(calls.begin(), calls.end(), calls.back()), calls.end());
    EXPECT_THAT(calls, Each("-T -o BatchMode=yes -- studio adminhostctl bridge"));
    EXPECT_THAT(server.inputs(), Each(StartsWith("socket:")));
}

TEST_F(RemoteHost, NoSshIsLeft) {
    EXPECT_EQ(remote({"camera", "list"}).status, 0);
    EXPECT_TRUE(eventually(
        [&] {
            return runProgram({"pgrep", "-f", server.toolDirectory().parent_path().string() + "/config"}).status == 1;
        },
        std::chrono::seconds(30)));
}

TEST_F(RemoteHost, NameThatLooksLikeAnOptionAndUnsafePathsAreRejected) {
    const std::string witness = root.directory() + "/witness";
    for (const std::vector<std::string>& words : std::vector<std::vector<std::string>>{
             {"--host=-oProxyCommand=touch " + witness, "daemon"},
             {"--host=anna@-oProxyCommand=touch " + witness, "daemon"},
             {"--host=", "daemon"},
             {"--host=studio", "--socket", "/run/$(touch " + witness + ")", "daemon"},
             {"--host=studio", "--socket", "relative", "daemon"},
         }) {
        std::vector<std::string> command = remoteCommand(words);
        command.erase(std::find(command.begin(), command.end(), "--host"), command.end());
        command.insert(command.end(), words.begin(), words.end());
        const ProgramResult result = runProgram(command, Errors::merge, "");
        EXPECT_EQ(result.status, 2) << words[0] << result.output;
    }
    EXPECT_TRUE(server.calls().empty());
    EXPECT_FALSE(std::filesystem::exists(witness));
}

TEST_F(RemoteHost, TextOfTheShellsStartFilesIsIgnored) {
    installCommandLine("echo 'Welcome to this machine'; printf 'No line end '\n");
    EXPECT_EQ(remote({"settings", "get", "server_port"}).output, "8170\n");
}

TEST_F(RemoteHost, CompletionStartsNoLogin) {
    const ProgramResult result = remote({"complete", "--", "--host", "studio", "camera", "show", ""});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.output, "");
    EXPECT_EQ(remote({"complete", "--", "--host", "studio", "camera", "sh"}).output, "show\n");
    EXPECT_TRUE(server.calls().empty());
}

TEST_F(RemoteHost, BridgeConnectsStandardInputAndOutputWithTheDaemon) {
    const ProgramResult result = runProgram(command({"bridge"}), Errors::merge,
                                            "GET /v1/ HTTP/1.1\r\nHost: localhost\r\nConnection: close\r\n\r\n");
    EXPECT_EQ(result.status, 0);
    EXPECT_THAT(result.output, AllOf(StartsWith("adminhostctl bridge begins\nadminhostctl bridge\nHTTP/1.1 200 "),
                                     HasSubstr("\"interface\":1")));
    EXPECT_EQ(remote({"bridge"}).status, 2) << "it is for this machine only";
    EXPECT_THAT(runProgram({program(), "--socket", "/nowhere/socket", "bridge"}, Errors::merge, "").output,
                StartsWith("adminhostctl bridge begins\nadminhostctl: the daemon cannot be reached at "));
}

TEST_F(RemoteHost, TimeOfAPasswordPromptDoesNotCount) {
    server.setPassphrase("open sesame");
    std::vector<std::string> command = remoteCommand({"--timeout", "5", "settings", "get", "server_port"});
    command.erase(command.begin(), command.begin() + 2);  // with the terminal
    OnTerminal terminal(command);
    EXPECT_THAT(terminal.showsUntil("Enter passphrase"), HasSubstr("Enter passphrase"));
    ::usleep(5'500'000);  // longer than the timeout
    terminal.type("open sesame\n");
    EXPECT_THAT(terminal.showsUntil("8170"), HasSubstr("8170"));
    EXPECT_EQ(terminal.wait(), 0);
    EXPECT_THAT(server.calls(), Each(Not(HasSubstr("BatchMode"))));
}

}  // namespace
}  // namespace adminhost::test
