#include "tests/support/Environment.h"
#include "tests/unit/platform/task/TaskDirectory.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <pthread.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

using namespace adminhost;
using namespace std::chrono_literals;
using testing::StartsWith;

namespace fs = std::filesystem;

class Task : public TaskDirectory {
  protected:
    void TearDown() override {
        setSystemRoot("/");
        TaskDirectory::TearDown();
    }

    std::int32_t run(const std::string& tool, const std::vector<std::string>& arguments) {
        return launch_task(DiskPath(tool), arguments, &_output, &_error);
    }
    std::int32_t shell(const std::string& script) { return run("/bin/sh", {"-c", script}); }
    std::int32_t shellWithInput(const std::string& script, const std::string& input) {
        return launch_task_with_input(DiskPath("/bin/sh"), {"-c", script}, input, &_output, &_error);
    }
    fs::path write(const std::string& name, const std::string& text, mode_t mode) {
        fs::path path = _dir / name;
        std::ofstream(path) << text;
        EXPECT_EQ(::chmod(path.c_str(), mode), 0);
        return path;
    }

    std::string _output = "old output";
    std::string _error = "old error";
};

/// A process that the tool leaves behind on purpose. The destructor ends it.
class Leftover {
  public:
    explicit Leftover(const std::string& pid) : _pid(pid.empty() ? 0 : static_cast<pid_t>(std::stol(pid))) {}
    Leftover(const Leftover&) = delete;
    Leftover& operator=(const Leftover&) = delete;
    ~Leftover() {
        if (_pid > 1) {
            ::kill(_pid, SIGKILL);
        }
    }
    [[nodiscard]] pid_t pid() const { return _pid; }

  private:
    pid_t _pid;
};

TEST_F(Task, AnswersExitStatusAndReplacesBothTexts) {
    EXPECT_EQ(shell("echo out; echo err >&2; exit 7"), 7);
    EXPECT_EQ(_output, "out\n");
    EXPECT_EQ(_error, "err\n");
}

TEST_F(Task, SilentSuccessEmptiesBothTexts) {
    EXPECT_EQ(run("/bin/true", {}), 0);
    EXPECT_EQ(_output, "");
    EXPECT_EQ(_error, "");
}

TEST_F(Task, HighestExitStatusIsNoSignal) {
    EXPECT_EQ(shell("exit 255"), 255);
}

TEST_F(Task, DeathBySignalIs128PlusItsNumber) {
    EXPECT_EQ(shell("kill -KILL $$"), 128 + SIGKILL);
    EXPECT_EQ(shell("kill -TERM $$"), 128 + SIGTERM);
    EXPECT_EQ(shell("kill -SEGV $$"), 128 + SIGSEGV);
}

TEST_F(Task, NullPlacesDropTheStreams) {
    EXPECT_EQ(launch_task(DiskPath("/bin/sh"), {"-c", "head -c 300000 /dev/zero; head -c 300000 /dev/zero >&2; exit 3"},
                          nullptr, nullptr),
              3);
}

TEST_F(Task, MegabyteOnEachStreamAtOnceArrivesWhole) {
    EXPECT_EQ(shell("head -c 1048576 /dev/zero | tr '\\0' a & head -c 1048576 /dev/zero | tr '\\0' b >&2; wait"), 0);
    EXPECT_EQ(_output, std::string(1048576, 'a'));
    EXPECT_EQ(_error, std::string(1048576, 'b'));
}

TEST_F(Task, MegabytesOneStreamAfterTheOtherArriveWhole) {
    EXPECT_EQ(shell("head -c 1048576 /dev/zero | tr '\\0' b >&2; head -c 1048576 /dev/zero | tr '\\0' a"), 0);
    EXPECT_EQ(_output.size(), 1048576U);
    EXPECT_EQ(_error.size(), 1048576U);
}

TEST_F(Task, FiveMegabytesOfInputAreEchoed) {
    std::string input;
    for (int i = 0; input.size() < 5'000'000; ++i) {
        input += std::to_string(i) + '\n';
    }
    EXPECT_EQ(launch_task_with_input(DiskPath("/bin/cat"), {}, input, &_output, &_error), 0);
    EXPECT_EQ(_output, input);
}

TEST_F(Task, EmptyInputIsAnInputAtItsEnd) {
    EXPECT_EQ(shellWithInput("test -p /dev/stdin && cat", ""), 0);
    EXPECT_EQ(_output, "");
}

TEST_F(Task, ToolThatIgnoresItsInputCostsNothing) {
    const std::string input(5'000'000, 'x');
    EXPECT_EQ(shellWithInput("exit 4", input), 4);
    EXPECT_EQ(shellWithInput("exec <&-; echo done; sleep 0.1; exit 5", input), 5);
    EXPECT_EQ(_output, "done\n");
}

TEST_F(Task, BrokenInputPipeLeavesNoSignalPendingAndTheMaskAsItWas) {
    struct sigaction before {};
    struct sigaction standard {};
    standard.sa_handler = SIG_DFL;
    ASSERT_EQ(::sigaction(SIGPIPE, &standard, &before), 0);
    EXPECT_EQ(shellWithInput("exec <&-; sleep 0.1", std::string(1'000'000, 'x')), 0);
    sigset_t set{};
    ::sigpending(&set);
    EXPECT_FALSE(::sigismember(&set, SIGPIPE));
    ::pthread_sigmask(SIG_BLOCK, nullptr, &set);
    EXPECT_FALSE(::sigismember(&set, SIGPIPE));
    ::sigaction(SIGPIPE, &before, nullptr);
}

TEST_F(Task, WithoutInputStandardInputIsTheNullDevice) {
    EXPECT_EQ(shell("readlink /proc/self/fd/0; cat"), 0);
    EXPECT_EQ(_output, "/dev/null\n");
}

TEST_F(Task, MissingToolIsAStartFailureWithTheSystemsText) {
    const std::string tool = _dir / "missing";
    EXPECT_EQ(run(tool, {}), -1);
    EXPECT_EQ(_error, tool + ": No such file or directory");
    EXPECT_EQ(_output, "");
}

TEST_F(Task, FileThatIsNotExecutableIsAStartFailure) {
    const std::string tool = write("tool", "#!/bin/sh\n", 0644);
    EXPECT_EQ(run(tool, {}), -1);
    EXPECT_EQ(_error, tool + ": Permission denied");
}

TEST_F(Task, DirectoryIsAStartFailure) {
    EXPECT_EQ(run(_dir, {}), -1);
    EXPECT_EQ(_error, _dir.string() + ": Permission denied");
}

TEST_F(Task, FileWithoutInterpreterLineIsNotGivenToAShell) {
    const std::string tool = write("tool", "echo ran\n", 0755);
    EXPECT_EQ(run(tool, {}), -1);
    EXPECT_EQ(_error, tool + ": Exec format error");
}

TEST_F(Task, RelativeToolIsAStartFailure) {
    EXPECT_EQ(run("bin/true", {}), -1);
    EXPECT_EQ(_error, "bin/true: Invalid argument");
}

TEST_F(Task, StartFailureNamesTheHostPath) {
    setSystemRoot(_dir);
    EXPECT_EQ(launch_task(diskPath(HostPath("/usr/bin/nimbo")), {}, &_output, &_error), -1);
    EXPECT_EQ(_error, "/usr/bin/nimbo: No such file or directory");
}

TEST_F(Task, NulInToolArgumentOrEnvironmentIsAStartFailureNeverATruncation) {
    EXPECT_EQ(run(std::string("/bin/echo\0x", 11), {}), -1);
    EXPECT_EQ(run("/bin/echo", {"a", std::string("b\0c", 3)}), -1);
    EXPECT_EQ(_error, "/bin/echo: Invalid argument");
    EXPECT_EQ(_output, "");
    EXPECT_EQ(launch_task_with_input_and_environment(DiskPath("/usr/bin/env"), {}, std::nullopt, &_output, &_error,
                                                     {{"A", std::string("b\0c", 3)}}),
              -1);
}

TEST_F(Task, VariableWithoutNameOrWithAnEqualsSignInItIsAStartFailure) {
    for (const std::string name : {"", "A=B"}) {
        EXPECT_EQ(launch_task_with_input_and_environment(DiskPath("/usr/bin/env"), {}, std::nullopt, &_output, &_error,
                                                         {{name, "x"}}),
                  -1);
        EXPECT_EQ(_error, "/usr/bin/env: Invalid argument");
    }
}

TEST_F(Task, LongestArgumentOfTheKernelPasses) {
    const std::string longest(131071, 'x');  // 128 KiB with the NUL
    EXPECT_EQ(run("/bin/echo", {"-n", longest}), 0);
    EXPECT_EQ(_output, longest);
}

TEST_F(Task, OneByteMoreThanTheKernelsArgumentIsAStartFailure) {
    EXPECT_EQ(run("/bin/echo", {std::string(131072, 'x')}), -1);
    EXPECT_EQ(_error, "/bin/echo: Argument list too long");
}

TEST_F(Task, ArgumentsArriveVerbatimAndTheFirstIsTheTool) {
    const std::string tool = write("tool", "#!/bin/sh\nprintf '[%s]' \"$0\" \"$@\"\n", 0755);
    EXPECT_EQ(run(tool, {"a b", "", "$(id)", "*", "q\"'\n", "à"}), 0);
    EXPECT_EQ(_output, "[" + tool + "][a b][][$(id)][*][q\"'\n][à]");
}

TEST_F(Task, BytesThatAreNotUtf8AreReplacedOneByOne) {
    EXPECT_EQ(shell("printf 'a\\377\\300\\200b\\303\\240'; printf '\\355\\240\\200' >&2"), 0);
    EXPECT_EQ(_output, "a\uFFFD\uFFFD\uFFFDb\u00E0");
    EXPECT_EQ(_error, "\uFFFD\uFFFD\uFFFD");
}

TEST_F(Task, NulInOutputIsKept) {
    EXPECT_EQ(shell("printf 'a\\0b'"), 0);
    EXPECT_EQ(_output, std::string("a\0b", 3));
}

TEST_F(Task, EnvironmentExtendsTheProcesses) {
    ASSERT_EQ(::setenv("ADMINHOST_KEPT", "kept", 1), 0);
    ASSERT_EQ(::setenv("ADMINHOST_CHANGED", "old", 1), 0);
    EXPECT_EQ(launch_task_with_input_and_environment(DiskPath("/bin/sh"), {"-c", "env | grep -a ^ADMINHOST_ | sort"},
                                                     std::nullopt, &_output, &_error,
                                                     {{"ADMINHOST_CHANGED", "new=x"}, {"ADMINHOST_EMPTY", ""}}),
              0);
    ::unsetenv("ADMINHOST_KEPT");
    ::unsetenv("ADMINHOST_CHANGED");
    EXPECT_EQ(_output, "ADMINHOST_CHANGED=new=x\nADMINHOST_EMPTY=\nADMINHOST_KEPT=kept\n");
}

TEST_F(Task, VariablesOfTheDaemonsOwnCredentialsAndServersDoNotReachTools) {
    const support::ScopedEnvironment environment({{"CREDENTIALS_DIRECTORY", "c"},
                                                  {"LISTEN_FDS", "1"},
                                                  {"LISTEN_FDNAMES", "a"},
                                                  {"LISTEN_PID", "1"},
                                                  {"KRB5CCNAME", "FILE:/daemon"},
                                                  {"KRB5_CLIENT_KTNAME", "FILE:/keys"},
                                                  {"LDAPURI", "ldap://a"},
                                                  {"LDAPTLS_REQCERT", "never"},
                                                  {"LISTENER", "kept"},
                                                  {"KRB5_CONFIG", "kept"},
                                                  {"ADMINHOST_LDAP", "kept"}});
    const std::string print = "env | grep -aE 'CREDENTIALS|LISTEN|KRB5|LDAP' | sort";
    EXPECT_EQ(shell(print), 0);
    EXPECT_EQ(_output, "ADMINHOST_LDAP=kept\nKRB5_CONFIG=kept\nLISTENER=kept\n");
    EXPECT_EQ(launch_task_with_input_and_environment(DiskPath("/bin/sh"), {"-c", print + "; echo $KRB5CCNAME"},
                                                     std::nullopt, &_output, &_error, {{"KRB5CCNAME", "FILE:/own"}}),
              0);
    EXPECT_EQ(_output, "ADMINHOST_LDAP=kept\nKRB5CCNAME=FILE:/own\nKRB5_CONFIG=kept\nLISTENER=kept\nFILE:/own\n")
        << "an operation may give its tool a cache";
}

TEST_F(Task, VariablesOfToolFilesReachOnlyTheToolsWhosePlanHasThem) {
    setToolFileVariables({{"ADMINHOST_FILES", "/private"}});
    EXPECT_EQ(shell("echo \"<$ADMINHOST_FILES>\""), 0);
    EXPECT_EQ(_output, "<>\n");
    EXPECT_EQ(launch_task_with_input_and_environment(DiskPath("/bin/sh"), {"-c", "echo \"<$ADMINHOST_FILES>\""},
                                                     std::nullopt, &_output, &_error, toolFileVariables()),
              0);
    setToolFileVariables({});
    EXPECT_EQ(_output, "</private>\n");
}

TEST_F(Task, DirectoryIsTheProcessesWhichIsTheRoot) {
    EXPECT_EQ(run("/bin/pwd", {"-P"}), 0);
    EXPECT_EQ(_output, "/\n");
    // A relative path refers to the same file in this process and in the tool.
    fs::current_path(_dir);
    EXPECT_EQ(run("/bin/pwd", {"-P"}), 0);
    EXPECT_EQ(_output, fs::canonical(_dir).string() + "\n");
    prepareForTasks();
    EXPECT_EQ(fs::current_path(), "/");
}

TEST_F(Task, UmaskIs022) {
    EXPECT_EQ(shell("umask"), 0);
    EXPECT_EQ(_output, "0022\n");
}

TEST_F(Task, BlockedAndIgnoredSignalsOfOursDoNotReachTheTool) {
    sigset_t blocked{};
    sigset_t before{};
    ::sigemptyset(&blocked);
    ::sigaddset(&blocked, SIGTERM);
    ::sigaddset(&blocked, SIGCHLD);
    ASSERT_EQ(::pthread_sigmask(SIG_BLOCK, &blocked, &before), 0);
    struct sigaction ignored {};
    struct sigaction oldPipe {};
    struct sigaction oldUser {};
    ignored.sa_handler = SIG_IGN;
    ASSERT_EQ(::sigaction(SIGPIPE, &ignored, &oldPipe), 0);
    ASSERT_EQ(::sigaction(SIGUSR1, &ignored, &oldUser), 0);
    const int status = run("/bin/grep", {"-E", "^Sig(Blk|Ign)", "/proc/self/status"});
    ::sigaction(SIGPIPE, &oldPipe, nullptr);
    ::sigaction(SIGUSR1, &oldUser, nullptr);
    ::pthread_sigmask(SIG_SETMASK, &before, nullptr);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(_output, "SigBlk:\t0000000000000000\nSigIgn:\t0000000000000000\n");
}

TEST_F(Task, IgnoredSigchldThatWasInheritedDoesNotLoseStatuses) {
    struct sigaction ignored {};
    ignored.sa_handler = SIG_IGN;
    ASSERT_EQ(::sigaction(SIGCHLD, &ignored, nullptr), 0);
    prepareForTasks();
    EXPECT_EQ(shell("exit 9"), 9);
}

TEST_F(Task, ToolGetsNoDescriptorOfOursNotEvenAnInheritableOne) {
    const int inheritable = ::open("/dev/null", O_RDONLY);
    ASSERT_GE(inheritable, 0);
    EXPECT_EQ(shellWithInput("exec ls /proc/self/fd", "x"), 0);
    ::close(inheritable);
    EXPECT_EQ(_output, "0\n1\n2\n3\n");  // 3 is the listing's own
}

TEST_F(Task, LaunchesWithStandardStreamsOfOursClosed) {
    const pid_t pid = ::fork();
    if (pid == 0) {
        ::close(0);
        ::close(1);
        ::close(2);
        std::string output;
        std::string error;
        const int status =
            launch_task_with_input(DiskPath("/bin/sh"), {"-c", "cat; echo err >&2"}, "in", &output, &error);
        ::_exit(status == 0 && output == "in" && error == "err\n" ? 0 : 1);
    }
    int status = -1;
    ASSERT_EQ(::waitpid(pid, &status, 0), pid);
    EXPECT_EQ(status, 0);
}

TEST_F(Task, ThousandLaunchesLeakNoDescriptorAndLeaveNoZombie) {
    ASSERT_EQ(run("/bin/true", {}), 0);
    const int before = openDescriptors();
    for (int i = 0; i < 1000; ++i) {
        ASSERT_EQ(i % 10 == 0 ? run("/missing", {}) : run("/bin/true", {}), i % 10 == 0 ? -1 : 0);
    }
    EXPECT_EQ(openDescriptors(), before);
    EXPECT_EQ(::waitpid(-1, nullptr, WNOHANG), -1);
    EXPECT_EQ(errno, ECHILD);
}

TEST_F(Task, OtherChildrenOfTheProcessAreNotReaped) {
    const pid_t other = ::fork();
    if (other == 0) {
        ::_exit(33);
    }
    EXPECT_EQ(shell("exit 0"), 0);
    int status = 0;
    ASSERT_EQ(::waitpid(other, &status, 0), other);
    EXPECT_EQ(WEXITSTATUS(status), 33);
}

TEST_F(Task, DaemonLeftBehindWithThePipesDoesNotHoldTheAnswerAndLivesOn) {
    const auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(shell("sleep 300 & echo $!; exit 6"), 6);
    EXPECT_LT(std::chrono::steady_clock::now() - start, 60s);  // far less than the daemon's running time
    const Leftover daemon(_output);
    EXPECT_TRUE(isAlive(daemon.pid()));
}

TEST_F(Task, OutputThatADaemonWritesAtOnceAfterTheToolsExitIsStillRead) {
    // The daemon writes as soon as it sees that the tool has exited (and waits to be reaped).
    EXPECT_EQ(shell("(while read -r line < /proc/$$/stat; do case $line in *') Z '*) break;; esac; done; echo late) &"),
              0);
    EXPECT_EQ(_output, "late\n");
}

TEST_F(Task, DaemonThatWritesForEverDoesNotHoldTheAnswer) {
    EXPECT_EQ(
        shell("(trap '' PIPE; while echo line 2>/dev/null; do :; done; exec sleep 300 >&- 2>&-) & echo $! >&2; exit 0"),
        0);
    EXPECT_THAT(_output, StartsWith("line\n"));
    const Leftover daemon(_error);
    EXPECT_TRUE(isAlive(daemon.pid()));
}

TEST_F(Task, OverrunToolIsKilledWithItsProcessGroup) {
    setTaskDeadline(std::chrono::steady_clock::now() + 300ms);
    EXPECT_EQ(shell("sleep 300 & echo $!; sleep 300"), 128 + SIGKILL);
    ASSERT_NE(_output, "");
    EXPECT_TRUE(isGoneSoon(static_cast<pid_t>(std::stol(_output))));
}

TEST_F(Task, OverrunToolThatWritesForEverIsKilled) {
    setTaskDeadline(std::chrono::steady_clock::now() + 100ms);
    EXPECT_EQ(launch_task(DiskPath("/bin/sh"), {"-c", "while echo line; do :; done"}, nullptr, nullptr), 128 + SIGKILL);
}

TEST_F(Task, OverrunToolThatDoesNotReadItsInputIsKilled) {
    setTaskDeadline(std::chrono::steady_clock::now() + 100ms);
    EXPECT_EQ(shellWithInput("sleep 300", std::string(1'000'000, 'x')), 128 + SIGKILL);
}

TEST_F(Task, ToolThatEndsInTimeIsNotTouchedByItsDeadline) {
    setTaskDeadline(std::chrono::steady_clock::now() + 1h);
    EXPECT_EQ(shell("sleep 300 & echo $!; exit 2"), 2);
    const Leftover daemon(_output);
    EXPECT_TRUE(isAlive(daemon.pid()));
}

TEST_F(Task, AfterTheDeadlineNoToolIsStarted) {
    setTaskDeadline(std::chrono::steady_clock::now() - 1ms);
    EXPECT_EQ(shell("touch " + (_dir / "ran").string()), -1);
    EXPECT_EQ(_error, "/bin/sh: not started: the time allowed for the request is over");
    EXPECT_FALSE(fs::exists(_dir / "ran"));
    setTaskDeadline(std::nullopt);
    EXPECT_EQ(shell("exit 0"), 0);
}

TEST_F(Task, OutputOverTheBoundIsAFailureAndEndsTheGroup) {
    setTaskOutputBound(100'000);
    EXPECT_EQ(shell("sleep 300 & echo $! > " + (_dir / "pid").string() + "; yes; true"), -1);
    EXPECT_EQ(_output, "");
    EXPECT_EQ(_error, "/bin/sh: stopped: it wrote more than 100000 bytes");
    std::string pid;
    std::ifstream(_dir / "pid") >> pid;
    ASSERT_NE(pid, "");
    EXPECT_TRUE(isGoneSoon(static_cast<pid_t>(std::stol(pid))));
}

TEST_F(Task, OutputOfExactlyTheBoundPassesAndOneByteMoreDoesNot) {
    setTaskOutputBound(100'000);
    EXPECT_EQ(run("/usr/bin/head", {"-c", "100000", "/dev/zero"}), 0);
    EXPECT_EQ(_output.size(), 100'000U);
    EXPECT_EQ(run("/usr/bin/head", {"-c", "100001", "/dev/zero"}), -1);
    EXPECT_EQ(shell("head -c 100001 /dev/zero >&2"), -1);
    EXPECT_EQ(launch_task(DiskPath("/usr/bin/head"), {"-c", "100001", "/dev/zero"}, nullptr, nullptr), -1);
}

TEST_F(Task, DefaultBoundIs256MiB) {
    EXPECT_EQ(taskDefaultOutputBound, 268'435'456U);
}

}  // namespace
