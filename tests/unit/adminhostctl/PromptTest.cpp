#include "adminhostctl/Failure.h"
#include "adminhostctl/Prompt.h"
#include "tests/support/OnTerminal.h"

#include <csignal>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/wait.h>
#include <termios.h>
#include <unistd.h>

namespace {

using adminhost::test::OnTerminal;
using testing::HasSubstr;
using testing::Not;

int say(const std::string& text) {
    return ::write(STDOUT_FILENO, text.data(), text.size()) < 0 ? 1 : 0;
}

int askAndSayLength() {
    try {
        const std::string secret = adminhost::ctl::askSecret("password");
        return say("length " + std::to_string(secret.size()) + (secret == "hunter2" ? " right." : " wrong."));
    } catch (const adminhost::ctl::Failure& failure) {
        say(std::string("failed: ") + failure.what() + ".");
        return static_cast<int>(failure.status());
    }
}

TEST(AskSecret, ShowsNothingOfWhatIsTyped) {
    OnTerminal child(&askAndSayLength);
    EXPECT_THAT(child.showsUntil("password: "), HasSubstr("password: "));
    child.type("hunter2\n");
    EXPECT_THAT(child.showsUntil("password again: "), HasSubstr("password again: "));
    child.type("hunter2\n");
    EXPECT_THAT(child.showsUntil("."), testing::AllOf(HasSubstr("length 7 right."), Not(HasSubstr("hunter2"))));
    EXPECT_EQ(child.wait(), 0);
}

TEST(AskSecret, TwoDifferentValuesAreAUsageError) {
    OnTerminal child(&askAndSayLength);
    child.showsUntil("password: ");
    child.type("hunter2\n");
    child.showsUntil("password again: ");
    child.type("hunter3\n");
    EXPECT_THAT(child.showsUntil("sent."), HasSubstr("password: the two values differ; nothing was sent"));
    EXPECT_EQ(WEXITSTATUS(child.wait()), 2);
}

TEST(AskSecret, PutsTheTerminalBackBeforeASignalEndsTheProgram) {
    OnTerminal child([] {
        try {
            static_cast<void>(adminhost::ctl::askSecret("password"));
        } catch (const adminhost::ctl::Failure&) {
            return 7;
        }
        return 0;
    });
    child.showsUntil("password: ");
    EXPECT_FALSE(child.echoes());
    child.type("hun\x03");  // the terminal's interrupt character
    const int status = child.wait();
    EXPECT_TRUE(WIFSIGNALED(status));
    EXPECT_EQ(WTERMSIG(status), SIGINT);
    EXPECT_TRUE(child.echoes());
}

TEST(AskSecret, AnEndOfInputWithoutALineIsAUsageError) {
    OnTerminal child(&askAndSayLength);
    child.showsUntil("password: ");
    child.type("\x04");  // end of input
    EXPECT_THAT(child.showsUntil("typed."), HasSubstr("password: no value was typed"));
    EXPECT_EQ(WEXITSTATUS(child.wait()), 2);
}

TEST(ReadSource, NamesTheFileThatCannotBeRead) {
    try {
        static_cast<void>(adminhost::ctl::readSource("/nowhere/file"));
        ADD_FAILURE();
    } catch (const adminhost::ctl::Failure& failure) {
        EXPECT_THAT(failure.what(), HasSubstr("/nowhere/file: No such file"));
        EXPECT_EQ(failure.status(), adminhost::ctl::ExitStatus::usage);
    }
}

}  // namespace
