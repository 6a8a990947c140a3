// Writes whose answer is lost: the outcome is determined and reported, and nothing is written a second time.

#include "tests/support/Eventually.h"
#include "tests/support/RunningProgram.h"
#include "tests/system/apply/ControlledService.h"

#include <csignal>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

class LostAnswers : public ControlledService {
  protected:
    explicit LostAnswers(const std::string& configuration = {}) : ControlledService(configuration) {}
    [[nodiscard]] std::size_t writes() const {
        std::size_t count = 0;
        for (const ToolCall& call : root.toolCalls()) {
            count += call.tool.ends_with("setup_lumioserverd_library") ? 1U : 0U;
        }
        return count;
    }
};

class Deadline : public LostAnswers {
  protected:
    Deadline() : LostAnswers("request_deadline_seconds = 5\n") {}
};

TEST_F(Deadline, ApplyReportsWhatWasWrittenBeforeItAndWhatWasNot) {
    root.recordToolCalls();
    root.setSwitch("setup_library.sleep", "30");
    const std::string desired = file(
        "desired.toml", "[settings]\nmember_uuid = \"0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1EFF\"\nserver_port = 8180\n");
    const ProgramResult apply = ctl({"apply", desired});
    EXPECT_EQ(apply.status, 1);
    EXPECT_THAT(apply.output, AllOf(HasSubstr("DEADLINE_EXCEEDED"), HasSubstr("has ended; it was not repeated"),
                                    testing::ContainsRegex("settings.member_uuid: [^\n]*: applied\n"),
                                    testing::ContainsRegex("settings.server_port: [^\n]* -> 8180: FAILED: ")));
    EXPECT_EQ(writes(), 1U);
}

TEST_F(Deadline, CommandReportsThatTheRequestHasEnded) {
    root.setSwitch("setup_library.sleep", "30");
    const ProgramResult write = ctl({"writeSettings", "configuration.server_port=8180"});
    EXPECT_EQ(write.status, 1);
    EXPECT_THAT(write.output, AllOf(HasSubstr("DEADLINE_EXCEEDED"), HasSubstr("has ended; it was not repeated")));
}

TEST_F(LostAnswers, KilledWorkerIsReportedAndNothingIsWrittenTwice) {
    root.recordToolCalls();
    holdWrite();
    RunningProgram set(command({"settings", "set", "server_port", "8180"}));
    waitForWrite();
    ::kill(daemon.workerPid(), SIGKILL);
    const ProgramResult result = set.wait();
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, AllOf(HasSubstr("WORKER_FAILED"), HasSubstr("has ended; it was not repeated"),
                                     HasSubstr("settings.server_port: 8170 -> 8180: FAILED: ")));
    EXPECT_LE(writes(), 1U);
}

TEST_F(LostAnswers, StateThatCannotBeReadBackCompletelyLeavesItUndetermined) {
    holdWrite();
    // A verb that concerns one setting would not read the access lists.
    RunningProgram set(command({"apply", file("port.toml", "[settings]\nserver_port = 8180\n")}));
    waitForWrite();
    root.sql("alter table access_control_entries rename to gone");
    ::kill(daemon.workerPid(), SIGKILL);
    const ProgramResult result = set.wait();
    EXPECT_EQ(result.status, 6);
    EXPECT_THAT(result.output,
                AllOf(HasSubstr("parts of the state could not be read:\n  not read: the access list ("),
                      HasSubstr("settings.server_port: 8170 -> 8180: not determined\n"), Not(HasSubstr(": FAILED:"))));
}

TEST_F(LostAnswers, DaemonThatIsGoneLeavesItUndetermined) {
    holdWrite();
    RunningProgram set(command({"settings", "set", "server_port", "8180"}));
    waitForWrite();
    const pid_t front = daemon.frontPid();
    const pid_t worker = daemon.workerPid();
    daemon.signal(SIGKILL);
    ::kill(front, SIGKILL);
    const ProgramResult result = set.wait();
    releaseWrite();
    EXPECT_TRUE(eventually([&] { return !isRunning(worker); }, std::chrono::seconds(30)))
        << "it finishes the write and ends";
    EXPECT_EQ(result.status, 6);
    EXPECT_THAT(result.output,
                AllOf(HasSubstr("the connection to the daemon was lost"), HasSubstr("the daemon cannot be reached"),
                      HasSubstr("settings.server_port: 8170 -> 8180: not determined\n")));
}

TEST_F(LostAnswers, InterruptedWriteIsReportedAndTheProgramEndsByTheSignal) {
    holdWrite();
    RunningProgram set(command({"settings", "set", "server_port", "8180"}));
    waitForWrite();
    set.signal(SIGINT);
    set.waitFor("interrupted");
    releaseWrite();
    const ProgramResult result = set.wait();
    EXPECT_EQ(result.status, 128 + SIGINT) << result.output;
    EXPECT_THAT(result.output, AllOf(HasSubstr("interrupted"), HasSubstr("has ended; it was not repeated"),
                                     HasSubstr("settings.server_port: 8170 -> 8180: applied\n")));
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8180\n");
}

TEST_F(LostAnswers, InterruptedCommandPrintsTheChangesThatTheDaemonReports) {
    holdWrite();
    RunningProgram write(command({"writeSettings", "configuration.server_port=8180"}));
    waitForWrite();
    write.signal(SIGINT);
    write.waitFor("interrupted");
    releaseWrite();
    const ProgramResult result = write.wait();
    EXPECT_EQ(result.status, 128 + SIGINT) << result.output;
    EXPECT_THAT(result.output, AllOf(HasSubstr("has ended; it was not repeated"),
                                     HasSubstr("the daemon reports these changes:\n  settings.server_port: "),
                                     HasSubstr(" -> 8180\n")));
}

TEST_F(LostAnswers, SecondInterruptEndsTheProgramAtOnceAndTheWriteIsCompleted) {
    holdWrite();
    RunningProgram set(command({"settings", "set", "server_port", "8180"}));
    waitForWrite();
    set.signal(SIGINT);
    set.waitFor("interrupted");
    set.signal(SIGINT);
    EXPECT_EQ(set.wait().status, 128 + SIGINT) << "although the write is held";
    releaseWrite();
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8180\n") << "which waits for the write";
}

TEST_F(LostAnswers, InterruptBeforeTheWriteEndsTheProgramAndNothingIsWritten) {
    root.hold("setup_preferences");
    RunningProgram set(command({"settings", "set", "server_port", "8180"}));
    ASSERT_TRUE(root.waitForHeld("setup_preferences"));
    set.signal(SIGINT);
    const ProgramResult result = set.wait();
    EXPECT_EQ(result.status, 128 + SIGINT) << "while it was reading";
    EXPECT_EQ(result.output, "");
    root.release("setup_preferences");
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8170\n");
    EXPECT_EQ(ctl({"history"}).output, "No change has been recorded yet.\n");
}

}  // namespace
}  // namespace adminhost::test
