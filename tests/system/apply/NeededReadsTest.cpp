// A verb that concerns one section reads that section only: with many cameras, the others take most of the time.

#include "tests/system/apply/ControlledService.h"

#include <filesystem>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::Contains;
using testing::HasSubstr;
using testing::Not;

class NeededReads : public ControlledService {
  protected:
    NeededReads() {
        // 036 is the record separator: statements may hold line feeds.
        root.write("/usr/bin/sqlite3",
                   "#!/bin/sh\nprintf '%s\\036' \"$3\" >> '" + record + "'\nexec /usr/bin/sqlite3 \"$@\"\n");
        std::filesystem::permissions(root.disk("/usr/bin/sqlite3"), std::filesystem::perms(0755));
    }
    /// The statements that the verb causes.
    [[nodiscard]] std::vector<std::string> statementsOf(const std::vector<std::string>& words) const {
        std::filesystem::remove(record);
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 0) << result.output;
        std::vector<std::string> statements;
        std::istringstream text(read(record));
        for (std::string statement; std::getline(text, statement, '\036');) {
            statements.push_back(statement);
        }
        return statements;
    }

    const std::string record = root.directory() + "/statements";
};

const auto readsCameras = Contains(AllOf(HasSubstr("from cameras where"), Not(HasSubstr("count("))));
const auto readsWorkflows = Contains(HasSubstr("from workflows where"));
const auto readsAccessLists = Contains(HasSubstr("select record_uuid from access_control_entries"));
const auto readsProperties = Contains(HasSubstr("select * from properties"));

TEST_F(NeededReads, SettingIsReadWithoutCamerasWorkflowsAndAccessLists) {
    const std::vector<std::string> statements = statementsOf({"settings", "get", "server_port"});
    EXPECT_THAT(statements, AllOf(readsProperties, Not(readsCameras), Not(readsWorkflows), Not(readsAccessLists)));
}

TEST_F(NeededReads, SettingIsWrittenWithoutCamerasWorkflowsAndAccessLists) {
    const std::vector<std::string> statements = statementsOf({"settings", "set", "server_port", "8180"});
    EXPECT_THAT(statements, AllOf(readsProperties, Not(readsCameras), Not(readsWorkflows), Not(readsAccessLists)));
    EXPECT_THAT(read(root.memberPreferencesPath()), HasSubstr("<integer>8180</integer>"));
}

TEST_F(NeededReads, ChangeOfASettingIsUndoneWithoutCamerasWorkflowsAndAccessLists) {
    ASSERT_EQ(ctl({"settings", "set", "server_port", "8180"}).status, 0);
    const std::vector<std::string> statements = statementsOf({"rollback", "1"});
    EXPECT_THAT(statements, AllOf(readsProperties, Not(readsCameras), Not(readsWorkflows), Not(readsAccessLists)));
    EXPECT_THAT(read(root.memberPreferencesPath()), HasSubstr("<integer>8170</integer>"));
}

TEST_F(NeededReads, PropertyIsWrittenWithoutCamerasWorkflowsAndAccessLists) {
    const std::vector<std::string> statements = statementsOf({"property", "set", "watermark", "left"});
    EXPECT_THAT(statements, AllOf(readsProperties, Not(readsCameras), Not(readsWorkflows), Not(readsAccessLists)));
    EXPECT_EQ(root.sql("select value from properties where name = 'watermark'"), "left\n");
}

TEST_F(NeededReads, CameraIsChangedWithoutWorkflowsAndProperties) {
    const std::vector<std::string> statements = statementsOf({"camera", "allow", "Roof", "anna"});
    EXPECT_THAT(statements, AllOf(readsCameras, Not(readsWorkflows), Not(readsProperties)));
    EXPECT_EQ(statementsOf({"--names", "camera", "list"}).size(), statementsOf({"camera", "list"}).size());
}

}  // namespace
}  // namespace adminhost::test
