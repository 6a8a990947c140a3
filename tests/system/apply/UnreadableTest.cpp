// A state that cannot be read completely is never exported as if the rest did not exist.

#include "tests/system/apply/ControlledService.h"

#include <filesystem>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;

class Unreadable : public ControlledService {
  protected:
    /// Exporting, to a file and to standard output, fails and writes nothing.
    void exportFails(const std::string& why) const {
        const std::string exported = file("state.toml", "the last good one\n");
        const ProgramResult result = ctl({"export", exported});
        EXPECT_EQ(result.status, 1) << why;
        EXPECT_THAT(result.output, HasSubstr(why));
        EXPECT_EQ(read(exported), "the last good one\n");
        EXPECT_EQ(ctl({"export"}).output, result.output);
    }
};

TEST_F(Unreadable, MissingDatabaseIsNotExported) {
    fs::remove(root.databasePath());
    exportFails("the service does not list its properties: its database is missing or cannot be read");
}

TEST_F(Unreadable, BrokenDatabaseIsNotExported) {
    std::ofstream(root.databasePath()) << std::string(4096, 'x');
    exportFails("parts of the state could not be read:\n  not read: the cameras (Error: ");
}

TEST_F(Unreadable, MissingTableOfWorkflowsIsNotExported) {
    root.sql("alter table workflows rename to gone");
    exportFails("not read: the workflows (");
}

TEST_F(Unreadable, MissingTableOfCamerasIsNotExported) {
    root.sql("alter table cameras rename to gone");
    exportFails("not read: the cameras (");
}

TEST_F(Unreadable, AccessListsThatCannotBeReadAreNotExportedAsEmpty) {
    root.sql("alter table access_control_entries rename to gone");
    exportFails("parts of the state could not be read:\n  not read: the access list (");
    EXPECT_EQ(ctl({"plan", file("empty.toml", "")}).status, 1);
    EXPECT_EQ(ctl({"camera", "allow", "Main hall", "ben"}).status, 1);
    EXPECT_EQ(ctl({"settings", "set", "server_port", "8180"}).status, 0) << "which has nothing to do with them";
}

TEST_F(Unreadable, AccessListsThatCannotBeReadAreNotListedAsEmpty) {
    root.sql("alter table access_control_entries rename to gone");
    for (const std::vector<std::string>& words : {std::vector<std::string>{"camera", "list"},
                                                  {"camera", "show", "Main hall"},
                                                  {"workflow", "list"},
                                                  {"workflow", "show", "Workflows/Publish.workflow"}}) {
        const ProgramResult list = ctl(words);
        EXPECT_EQ(list.status, 1) << words.front();
        EXPECT_THAT(list.output, HasSubstr("parts of the list could not be read:\n  not read: the access list ("));
        EXPECT_THAT(list.output, testing::AnyOf(HasSubstr("Main hall"), HasSubstr("Publish"))) << "with the rest";
    }
}

TEST_F(Unreadable, FailureOfTheDatabaseInsideAnAnswerIsExplained) {
    std::ofstream(root.databasePath()) << std::string(4096, 'x');
    const ProgramResult command = ctl({"getCameras"});
    EXPECT_EQ(command.status, 1);
    EXPECT_THAT(command.output, HasSubstr("the service returned an error: readStatus is 26: file is not a database"));
    root.setSwitch("setup_preferences.exit", "3");
    const ProgramResult read = ctl({"readSettings"});
    EXPECT_EQ(read.status, 1);
    EXPECT_THAT(read.output, testing::AllOf(HasSubstr("readStatus is 3"), HasSubstr("log lines of the request:\n  ")));
}

TEST_F(Unreadable, GarbageInPlaceOfTheDatabaseIsExplainedAndTheLogLinesOfTheRequestFollow) {
    std::ofstream(root.databasePath()) << std::string(4096, 'x');
    const std::string port = file("port.toml", "[settings]\nserver_port = 8180\n");
    const std::string explanation = "the database cannot be read: file is not a database (26)\n";
    for (const std::vector<std::string>& words : {std::vector<std::string>{"plan", port},
                                                  {"apply", port},
                                                  {"plan", port, "--only", "settings,properties"},
                                                  {"export"},
                                                  {"property", "list"},
                                                  {"property", "set", "colour", "blue"}}) {
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 1) << words.front();
        EXPECT_THAT(result.output, testing::AllOf(HasSubstr(explanation), HasSubstr("log lines of the request:\n  "),
                                                  HasSubstr("Can't execute sqlite3 query: Error: in prepare, file is "
                                                            "not a database (26)\n")));
    }
    const ProgramResult cameras = ctl({"camera", "list"});
    EXPECT_EQ(cameras.status, 1);
    EXPECT_EQ(cameras.output, "adminhostctl: the service does not list its cameras: " + explanation)
        << "this request logs nothing";
    const ProgramResult command = ctl({"--format", "json", "readSettings"});
    EXPECT_EQ(command.status, 1);
    EXPECT_THAT(command.output, testing::AllOf(HasSubstr("not read: the cameras (Error: in prepare, file is not a "
                                                         "database (26))\n"),
                                               HasSubstr("\nlog lines of the request:\n  ")));
    // Settings are not in the database.
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8170\n");
    EXPECT_EQ(ctl({"apply", port, "--only", "settings"}).output, "settings.server_port: 8170 -> 8180: applied\n");
}

TEST_F(Unreadable, ListsOfABrokenDatabaseFailInTheSameWords) {
    std::ofstream(root.databasePath()) << std::string(4096, 'x');
    for (const std::string what : {"camera", "workflow", "property"}) {
        const ProgramResult list = ctl({what, "list"});
        EXPECT_EQ(list.status, 1) << what;
        EXPECT_THAT(list.output, HasSubstr(": the database cannot be read: file is not a database"));
    }
}

}  // namespace
}  // namespace adminhost::test
