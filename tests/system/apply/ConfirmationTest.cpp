// Verbs that cannot be undone, or that remove much at once, ask at a terminal.

#include "tests/support/OnTerminal.h"
#include "tests/system/apply/ControlledService.h"

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

struct Question {
    std::vector<std::string> words;
    std::string text;
    std::string counted;  ///< the statement that counts what is to be removed
    std::string before;
};

class Confirmation : public ControlledService {
  protected:
    [[nodiscard]] std::vector<std::string> command(std::vector<std::string> words) const {
        words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon.socket()});
        return words;
    }
    /// Types the reply at the question, and returns what the terminal has shown and the exit status.
    [[nodiscard]] ProgramResult replying(const Question& question, const std::string& reply) const {
        OnTerminal terminal(command(question.words));
        EXPECT_THAT(terminal.showsUntil("[y/N] "), HasSubstr(question.text));
        terminal.type(reply);
        ProgramResult result;
        result.output = terminal.showsUntil("the end of the program");
        result.status = WEXITSTATUS(terminal.wait());
        return result;
    }

    const std::vector<Question> questions = {
        {{"camera", "remove", "Studio A"},
         "The camera \"Studio A\" is removed, which cannot be undone. Continue? [y/N] ",
         "select count(*) from cameras where name = 'Studio A'",
         "1\n"},
        {{"property", "remove", "default_language"},
         "The property \"default_language\" is removed. Continue? [y/N] ",
         "select count(*) from properties where name = 'default_language'",
         "1\n"},
        {{"access", "juergen", "--revoke"},
         "All entries of juergen are removed. Continue? [y/N] ",
         "select count(*) from access_control_entries where record_uuid = '" + SampleRoot::uuidOf("user", "juergen") +
             "'",
         root.sql("select count(*) from access_control_entries where record_uuid = '" +
                  SampleRoot::uuidOf("user", "juergen") + "'")},
    };
};

TEST_F(Confirmation, ReplyThatIsNotYesChangesNothing) {
    for (const Question& question : questions) {
        for (const char* const reply : {"n\n", "\n", "yesterday\n", "\x04"}) {
            const ProgramResult result = replying(question, reply);
            EXPECT_EQ(result.status, 1) << question.words[0];
            EXPECT_THAT(result.output, AllOf(HasSubstr("Nothing was done."), Not(HasSubstr(": applied"))));
            EXPECT_EQ(root.sql(question.counted), question.before);
        }
    }
    EXPECT_EQ(ctl({"history"}).output, "No change has been recorded yet.\n");
}

TEST_F(Confirmation, YesIsCarriedOutAfterTheQuestion) {
    for (const Question& question : questions) {
        const ProgramResult result = replying(question, "yes\n");
        EXPECT_EQ(result.status, 0) << question.words[0] << result.output;
        EXPECT_THAT(result.output, HasSubstr(": applied"));
        EXPECT_EQ(root.sql(question.counted), "0\n");
    }
}

TEST_F(Confirmation, EntriesOfAPersonAreShownBeforeTheQuestion) {
    OnTerminal terminal(command({"--languages", "en", "access", "juergen", "--revoke"}));
    EXPECT_THAT(terminal.showsUntil("[y/N] "),
                AllOf(HasSubstr("cameras.\"Studio A\".users.juergen: (allowed) -> (not allowed)\r\n"),
                      HasSubstr("workflows.\"Picture in Picture\".users.juergen: (allowed) -> (not allowed)\r\n")));
    terminal.type("n\n");
    EXPECT_EQ(WEXITSTATUS(terminal.wait()), 1);
}

TEST_F(Confirmation, OptionYesAndDryRunDoNotAsk) {
    for (const Question& question : questions) {
        for (const std::string option : {"--dry-run", "--yes"}) {
            const std::string before = root.sql(question.counted);
            std::vector<std::string> words = command(question.words);
            words.push_back(option);
            OnTerminal terminal(words);
            EXPECT_THAT(terminal.showsUntil("the end of the program"), Not(HasSubstr("[y/N]")));
            EXPECT_EQ(WEXITSTATUS(terminal.wait()), 0) << question.words[0];
            EXPECT_EQ(root.sql(question.counted), option == "--yes" ? "0\n" : before);
        }
    }
}

TEST_F(Confirmation, InterruptAtTheQuestionEndsTheProgramAndChangesNothing) {
    for (const Question& question : questions) {
        OnTerminal terminal(command(question.words));
        terminal.showsUntil("[y/N] ");
        terminal.type("\x03");
        const int status = terminal.wait();
        EXPECT_TRUE(WIFSIGNALED(status)) << question.words[0];
        EXPECT_EQ(root.sql(question.counted), question.before);
    }
}

}  // namespace
}  // namespace adminhost::test
