#include "platform/task/Confinement.h"
#include "platform/task/Task.h"
#include "settings/DatabaseTool.h"
#include "settings/SettingsStore.h"
#include "tests/support/TemporaryRoot.h"

#include <chrono>
#include <filesystem>
#include <fstream>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <pwd.h>
#include <unistd.h>

namespace lumio {
namespace {

using adminhost::Probe;
using State = adminhost::Probe::State;
using testing::HasSubstr;

class DatabaseToolTest : public testing::Test {
  protected:
    DatabaseToolTest() {
        root.write("/Library/SorvaneProducer/Shared/Server/db.sqlite3", "");
        std::filesystem::create_directories(home());
    }
    ~DatabaseToolTest() override { adminhost::setTaskDeadline(std::nullopt); }
    DatabaseToolTest(const DatabaseToolTest&) = delete;
    DatabaseToolTest& operator=(const DatabaseToolTest&) = delete;

    [[nodiscard]] std::string home() const { return root.path("/home").string(); }
    /// Replaces the tool by a script that records each run.
    void replaceTool(const std::string& text) const {
        std::filesystem::remove(root.path("/usr/bin/sqlite3"));
        root.writeTool("/usr/bin/sqlite3", "#!/bin/sh\necho run >> '" + root.path("/runs").string() + "'\n" + text);
    }
    [[nodiscard]] std::size_t runs() const {
        return std::filesystem::exists(root.path("/runs")) ? root.read("/runs").size() / 4 : 0;
    }

    adminhost::test::TemporaryRoot root;
    DatabaseTool tool{home()};
};

TEST_F(DatabaseToolTest, RealToolIsUsable) {
    const Probe probe = tool.probe();
    EXPECT_EQ(probe.state, State::usable) << probe.reason;
}

TEST_F(DatabaseToolTest, ToolThatWasUsableIsNotTriedAgain) {
    replaceTool("exec /usr/bin/sqlite3 \"$@\"\n");
    EXPECT_EQ(tool.probe().state, State::usable);
    EXPECT_EQ(tool.probe().state, State::usable);
    EXPECT_EQ(runs(), 1U);
}

TEST_F(DatabaseToolTest, WithoutADatabaseFileTheToolIsNotTriedAndItIsOnceThereIsOne) {
    std::filesystem::remove(root.path("/Library/SorvaneProducer/Shared/Server/db.sqlite3"));
    replaceTool("exit 1\n");
    EXPECT_EQ(tool.probe().state, State::usable);
    EXPECT_EQ(runs(), 0U);
    root.write("/Library/SorvaneProducer/Shared/Server/db.sqlite3", "");
    EXPECT_EQ(tool.probe().state, State::unusable);
    EXPECT_EQ(runs(), 1U);
}

TEST_F(DatabaseToolTest, WithoutADatabaseFileAStartFileRefusesNothing) {
    std::filesystem::remove(root.path("/Library/SorvaneProducer/Shared/Server/db.sqlite3"));
    root.write("/home/.sqliterc", ".nullvalue x\n");
    EXPECT_EQ(tool.probe().state, State::usable);
}

TEST_F(DatabaseToolTest, ToolThatIsNotStartedBecauseTheTimeIsOverIsUnknown) {
    adminhost::setTaskDeadline(std::chrono::steady_clock::now() - std::chrono::seconds(1));
    EXPECT_EQ(tool.probe().state, State::unknown);
    adminhost::setTaskDeadline(std::nullopt);
    EXPECT_EQ(tool.probe().state, State::usable);
}

TEST_F(DatabaseToolTest, MissingToolIsUnusableUntilItIsInstalled) {
    std::filesystem::remove(root.path("/usr/bin/sqlite3"));
    const Probe probe = tool.probe();
    EXPECT_EQ(probe.state, State::unusable);
    EXPECT_THAT(probe.reason, HasSubstr("/usr/bin/sqlite3 cannot be run ("));
    EXPECT_EQ(probe.fix, "install the package sqlite3");
    std::filesystem::create_symlink("/usr/bin/sqlite3", root.path("/usr/bin/sqlite3"));
    EXPECT_EQ(tool.probe().state, State::usable);
}

TEST_F(DatabaseToolTest, ToolThatPrintsRowsInAnotherFormIsUnusable) {
    replaceTool("printf 'a: x = y\\nlongername: quoted text\\nc: \\n'\n");
    const Probe probe = tool.probe();
    EXPECT_EQ(probe.state, State::unusable);
    EXPECT_EQ(probe.reason, "/usr/bin/sqlite3 does not print rows in the form that this release reads");
}

TEST_F(DatabaseToolTest, ToolThatEscapesControlCharactersIsUnusable) {
    replaceTool("/usr/bin/sqlite3 \"$@\" | sed 's/\\x1b/^[/g'\n");
    EXPECT_EQ(tool.probe().state, State::unusable);
    replaceTool("/usr/bin/sqlite3 \"$@\" | sed 's/\\t/\\\\t/g'\n");
    EXPECT_EQ(tool.probe().state, State::unusable);
    replaceTool("/usr/bin/sqlite3 \"$@\" | sed 's/^feed/           feed/'\n");
    EXPECT_EQ(tool.probe().state, State::unusable) << "a line feed in a value";
    replaceTool("/usr/bin/sqlite3 \"$@\" | cat\n");
    EXPECT_EQ(tool.probe().state, State::usable);
}

TEST_F(DatabaseToolTest, ToolThatRefusesDoubleQuotedTextIsUnusable) {
    replaceTool("echo 'Error: no such column: \"quoted text\"' >&2\nexit 1\n");
    const Probe probe = tool.probe();
    EXPECT_EQ(probe.state, State::unusable);
    EXPECT_EQ(probe.reason, "/usr/bin/sqlite3 failed with status 1: Error: no such column: \"quoted text\"");
}

TEST_F(DatabaseToolTest, ToolThatDoesNotFinishIsUnknownAndTriedAgain) {
    replaceTool("exec sleep 60\n");
    adminhost::setTaskDeadline(std::chrono::steady_clock::now() + std::chrono::milliseconds(100));
    const Probe probe = tool.probe();
    EXPECT_EQ(probe.state, State::unknown);
    EXPECT_EQ(probe.reason, "/usr/bin/sqlite3 was ended before it had finished");
    adminhost::setTaskDeadline(std::nullopt);
    replaceTool("exec /usr/bin/sqlite3 \"$@\"\n");
    EXPECT_EQ(tool.probe().state, State::usable);
}

TEST_F(DatabaseToolTest, LackOfMemoryProcessesOrDescriptorsIsUnknown) {
    for (const char* const message :
         {"Error: out of memory", "libsqlite3.so.0: failed to map segment: Cannot allocate memory",
          "cannot fork: Resource temporarily unavailable", "Too many open files"}) {
        replaceTool(std::string("echo '") + message + "' >&2\nexit 1\n");
        EXPECT_EQ(tool.probe().state, State::unknown) << message;
    }
}

TEST_F(DatabaseToolTest, StartFileThatTheToolCanReadIsLookedForEachTime) {
    // In the database's directory, which the tool can read also when it is confined.
    const std::string place = root.path("/Library/SorvaneProducer/Shared/Server").string();
    DatabaseTool here{place};
    EXPECT_EQ(here.probe().state, State::usable);
    std::ofstream(place + "/.sqliterc") << ".nullvalue NULL\n";
    const Probe probe = here.probe();
    EXPECT_EQ(probe.state, State::unusable);
    EXPECT_EQ(probe.reason, place + "/.sqliterc can change what /usr/bin/sqlite3 prints");
    EXPECT_EQ(probe.fix, "remove the file, or move it away");
    std::filesystem::remove(place + "/.sqliterc");
    EXPECT_EQ(here.probe().state, State::usable);
    std::ofstream(home() + "/elsewhere") << ".nullvalue NULL\n";
    std::filesystem::create_symlink(place + "/.sqliterc", home() + "/.sqliterc");
    std::filesystem::rename(home() + "/elsewhere", place + "/.sqliterc");
    EXPECT_EQ(tool.probe().state, State::unusable) << "a link into that directory";
}

TEST_F(DatabaseToolTest, StartFileElsewhereMattersOnlyIfTheToolIsNotConfined) {
    std::ofstream(home() + "/.sqliterc") << ".nullvalue NULL\n";
    EXPECT_EQ(tool.probe().state, adminhost::Confinement::isAvailable() ? State::usable : State::unusable);
    replaceTool("exec /usr/bin/sqlite3 \"$@\"\n");
    const Probe probe = tool.probe();
    EXPECT_EQ(probe.state, State::unusable) << "a script is not confined";
    EXPECT_EQ(probe.reason, home() + "/.sqliterc can change what /usr/bin/sqlite3 prints");
}

TEST_F(DatabaseToolTest, HomeIsThatOfTheAccountDatabaseWhateverTheEnvironmentSays) {
    const passwd* entry = ::getpwuid(::geteuid());
    ASSERT_NE(entry, nullptr);
    const char* before = std::getenv("HOME");
    const std::string kept = before == nullptr ? "" : before;
    ::setenv("HOME", home().c_str(), 1);
    EXPECT_EQ(DatabaseTool::homeOf(::geteuid()), entry->pw_dir);
    ::setenv("HOME", kept.c_str(), 1);
}

}  // namespace
}  // namespace lumio
