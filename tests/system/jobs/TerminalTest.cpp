// A terminal of 40 columns.

#include "adminhostctl/Width.h"
#include "tests/system/jobs/Jobs.h"

#include <array>
#include <cerrno>

#include <pty.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::ContainsRegex;
using testing::HasSubstr;
using testing::Not;

class NarrowTerminal : public Jobs {
  protected:
    /// What adminhostctl prints at a terminal of this width.
    [[nodiscard]] static std::string screen(std::vector<std::string> words, unsigned short columns = 40) {
        words.insert(words.begin(), {ctlProgram, "--socket", daemon->socket()});
        std::vector<char*> arguments;
        for (std::string& word : words) {
            arguments.push_back(word.data());
        }
        arguments.push_back(nullptr);
        const winsize size{25, columns, 0, 0};
        int terminal = -1;
        const pid_t child = ::forkpty(&terminal, nullptr, nullptr, &size);
        if (child == 0) {
            char* none[] = {nullptr};
            ::execve(arguments[0], arguments.data(), none);
            ::_exit(127);
        }
        std::string text;
        std::array<char, 4096> piece{};
        for (ssize_t count = 0; (count = ::read(terminal, piece.data(), piece.size())) > 0 || errno == EINTR;) {
            text.append(piece.data(), count > 0 ? static_cast<std::size_t>(count) : 0);
        }
        ::close(terminal);
        int status = 0;
        EXPECT_EQ(::waitpid(child, &status, 0), child);
        EXPECT_TRUE(WIFEXITED(status)) << text;
        std::erase(text, '\r');
        return text;
    }
};

TEST_F(NarrowTerminal, NoLineIsLongerThanTheTerminal) {
    ASSERT_EQ(ctl({"settings", "set", "camera_preview_cache_seconds", "3"}).status, 0);
    for (const std::vector<std::string>& words : {std::vector<std::string>{"help"},
                                                  {"help", "settings", "set"},
                                                  {"help", "camera", "list"},
                                                  {"--help"},
                                                  {"status"},
                                                  {"doctor"},
                                                  {"commands"},
                                                  {"logs"},
                                                  {"history"},
                                                  {"settings", "get"},
                                                  {"explain", "server_host"},
                                                  {"camera", "list", "--match", "*hall*"},
                                                  {"property", "list"},
                                                  {"access", "ben", "--restricted"},
                                                  {"whois", "ben"}}) {
        const std::string text = screen(words);
        EXPECT_GT(linesOf(text).size(), 2U) << text;
        for (const std::string& line : linesOf(text)) {
            if (line.starts_with("  adminhostctl ")) {
                continue;  // an example, to be copied
            }
            EXPECT_LE(adminhost::ctl::widthOf(line), 40U) << testing::PrintToString(words) << '\n' << line;
        }
    }
}

TEST_F(NarrowTerminal, HistoryKeepsWhatWasChanged) {
    ASSERT_EQ(ctl({"settings", "set", "camera_preview_cache_seconds", "4"}).status, 0);
    const std::string text = screen({"history", "--key", "camera_preview_cache_seconds"});
    EXPECT_THAT(text, AllOf(ContainsRegex("NUMBER +WHEN +CHANGED\n"), HasSubstr("(omitted columns: WHO)"),
                            HasSubstr("camera_preview_cac"), ContainsRegex(" 4 s\n"), Not(HasSubstr("\n\n\n"))));
}

TEST_F(NarrowTerminal, ListKeepsWhoMayUseTheElements) {
    EXPECT_THAT(
        screen({"camera", "list", "--match", "Studio ?"}),
        AllOf(ContainsRegex("NAME +STATUS +ALLOWED\n"), HasSubstr("(omitted columns: LAST USED, BY,\nRESTRICTED)")));
}

TEST_F(NarrowTerminal, WordsAreNotBrokenInHelp) {
    const std::string text = screen({"help"});
    EXPECT_THAT(text,
                AllOf(HasSubstr("\n  recycleService\n      Do nothing"), HasSubstr("\n  camera list\n      List the")));
}

}  // namespace
}  // namespace adminhost::test
