#include "tests/system/ctl/FixtureClient.h"

#include <chrono>
#include <csignal>
#include <iterator>
#include <thread>

#include <fcntl.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

class LogsVerb : public FixtureClient {
  protected:
    LogsVerb() {
        fs::create_directories(log().parent_path());
        fs::permissions(log().parent_path(), fs::perms(0755));
        for (int i = 1; i <= 30; ++i) {
            append(log(), "line " + std::to_string(i) + "\n");
        }
    }
    [[nodiscard]] fs::path log() const { return disk("/var/log/fixture/fixture.log"); }
    [[nodiscard]] fs::path other() const { return disk("/var/log/fixture/other.log"); }
    void rotate() const { fs::rename(log(), log().string() + ".1"); }
};

/// A command that runs beside the test; ended with the object.
class Background {
  public:
    Background(std::vector<std::string> words, fs::path output) : _output(std::move(output)) {
        posix_spawn_file_actions_t actions;
        ::posix_spawn_file_actions_init(&actions);
        ::posix_spawn_file_actions_addopen(&actions, STDOUT_FILENO, _output.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                           0600);
        ::posix_spawn_file_actions_adddup2(&actions, STDOUT_FILENO, STDERR_FILENO);
        std::vector<char*> pointers;
        pointers.reserve(words.size() + 1);
        for (std::string& word : words) {
            pointers.push_back(word.data());
        }
        pointers.push_back(nullptr);
        EXPECT_EQ(::posix_spawn(&_pid, words.front().c_str(), &actions, nullptr, pointers.data(), environ), 0);
        ::posix_spawn_file_actions_destroy(&actions);
    }
    Background(const Background&) = delete;
    Background& operator=(const Background&) = delete;
    ~Background() {
        ::kill(_pid, SIGTERM);
        ::waitpid(_pid, nullptr, 0);
    }
    [[nodiscard]] std::string output() const {
        std::ifstream file(_output);
        return {std::istreambuf_iterator<char>(file), {}};
    }
    /// Returns true if the output ends with the text within 20 seconds.
    [[nodiscard]] bool endsWith(const std::string& text) const {
        for (int i = 0; i < 400; ++i) {
            if (output().ends_with(text)) {
                return true;
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
        }
        return false;
    }

  private:
    fs::path _output;
    pid_t _pid = -1;
};

TEST_F(LogsVerb, WithoutANameTheLogsAreListedWithTheirSizes) {
    append(other(), std::string(2'000'000, 'x'));
    const ProgramResult result = ctl({"logs"});
    EXPECT_EQ(result.status, 0);
    EXPECT_THAT(result.output, AllOf(HasSubstr("log    "), HasSubstr("/var/log/fixture/fixture.log"),
                                     HasSubstr("2.0 MB"), HasSubstr("other")));
    EXPECT_EQ(ctl({"logs", "--names"}).output, "log\nother\n");
    EXPECT_THAT(ctl({"--format", "json", "logs"}).output, HasSubstr("\"logs\": ["));
}

TEST_F(LogsVerb, LastLinesArePrinted) {
    EXPECT_EQ(ctl({"logs", "-n", "2", "log"}).output, "line 29\nline 30\n");
    EXPECT_EQ(ctl({"logs", "-n", "0", "log"}).output, "");
    const std::string ten = ctl({"logs", "log"}).output;
    EXPECT_TRUE(ten.starts_with("line 21\n")) << ten;
    const std::string all = ctl({"logs", "-n", "1000", "log"}).output;
    EXPECT_TRUE(all.starts_with("line 1\n") && all.ends_with("line 30\n")) << all;
    append(log(), "no end of line");
    EXPECT_EQ(ctl({"logs", "-n", "2", "log"}).output, "line 30\nno end of line\n");
}

TEST_F(LogsVerb, LinesAreFoundAlsoIfTheyAreLongerThanOnePiece) {
    append(log(), std::string(3'000'000, 'a') + "\n" + std::string(100'000, 'b') + "\n");
    const std::string output = ctl({"logs", "-n", "3", "log"}).output;
    EXPECT_EQ(output.size(), 8U + 3'000'001 + 100'001);
    EXPECT_TRUE(output.starts_with("line 30\naaa"));
}

TEST_F(LogsVerb, FollowingGoesOnThroughARotation) {
    const Background follower(command({"logs", "-f", "-n", "1", "log"}), daemon.directory() / "out");
    ASSERT_TRUE(follower.endsWith("line 30\n")) << follower.output();
    append(log(), "before\n");
    ASSERT_TRUE(follower.endsWith("before\n")) << follower.output();
    append(log(), "last of the old\n");
    rotate();
    append(log(), "first of the new\n");
    ASSERT_TRUE(follower.endsWith("first of the new\n")) << follower.output();
    EXPECT_EQ(follower.output(), "line 30\nbefore\nlast of the old\nfirst of the new\n");
}

TEST_F(LogsVerb, FollowingReportsLinesThatMayBeMissing) {
    const Background follower(command({"logs", "-f", "-n", "1", "log"}), daemon.directory() / "out");
    ASSERT_TRUE(follower.endsWith("line 30\n"));
    fs::resize_file(log(), 0);
    append(log(), "again\n");
    ASSERT_TRUE(follower.endsWith("again\n")) << follower.output();
    EXPECT_THAT(follower.output(), HasSubstr("log: lines may be missing here"));
}

TEST_F(LogsVerb, FollowingWaitsForAFileThatDoesNotExistYet) {
    const Background follower(command({"logs", "-f", "other"}), daemon.directory() / "out");
    std::this_thread::sleep_for(std::chrono::milliseconds(300));
    append(other(), "now\n");
    EXPECT_TRUE(follower.endsWith("now\n")) << follower.output();
    EXPECT_EQ(follower.output(), "now\n");
}

TEST_F(LogsVerb, SeveralLogsHaveHeadings) {
    append(other(), "of the other\n");
    EXPECT_EQ(ctl({"logs", "-n", "1"}).output, "==> log <==\nline 30\n\n==> other <==\nof the other\n");
}

TEST_F(LogsVerb, LinkThatSomeoneCreatedIsNotPrinted) {
    append(daemon.directory() / "secret", "top secret\n");
    fs::remove(log());
    fs::create_symlink(daemon.directory() / "secret", log());
    fs::permissions(log().parent_path(), fs::perms(0777));
    for (const std::vector<std::string>& words : {std::vector<std::string>{"logs", "log"}, {"logs", "-f", "log"}}) {
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 1);
        EXPECT_THAT(result.output, AllOf(HasSubstr("is a link"), Not(HasSubstr("top secret"))));
    }
    EXPECT_THAT(ctl({"logs"}).output, HasSubstr("not readable"));
}

TEST_F(LogsVerb, PipeIsNotWaitedFor) {
    fs::remove(log());
    ASSERT_EQ(::mkfifo(log().c_str(), 0600), 0);
    const ProgramResult result = ctl({"logs", "log"});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, HasSubstr("is not a regular file"));
}

TEST_F(LogsVerb, MissingFileAndUnknownNameAreNamed) {
    fs::remove(log());
    EXPECT_EQ(ctl({"logs", "log"}).status, 1);
    EXPECT_THAT(ctl({"logs", "log"}).output, HasSubstr("has not been written yet"));
    EXPECT_EQ(ctl({"logs", "nolog"}).status, 2);
    EXPECT_THAT(ctl({"logs", "nolog"}).output, HasSubstr("log not found: nolog; the logs are log, other"));
    EXPECT_EQ(ctl({"logs", "-n", "-1", "log"}).status, 2);
    EXPECT_EQ(ctl({"--format", "json", "logs", "log"}).status, 2);
}

TEST_F(LogsVerb, ControlCharactersOfALogAreShownAsTheirNumbers) {
    append(log(), "a\x1b[31mb\xff\n");
    EXPECT_EQ(ctl({"logs", "-n", "1", "log"}).output, "a\\x1b[31mb\xEF\xBF\xBD\n");
}

}  // namespace
}  // namespace adminhost::test
