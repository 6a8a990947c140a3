// A verb that concerns one section reads that section only: with many cameras, the others take most of the time.

#include "tests/system/apply/ControlledService.h"

#include <algorithm>
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
        return recorded();
    }
    [[nodiscard]] std::vector<std::string> recorded() const {
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

TEST_F(NeededReads, RemovedPropertiesAreReadWithOneStatementBeforeTheWriteAndOtherWritesReadNothingMore) {
    const auto idOf = [&](const std::string& name) {
        return std::stoi(root.sql("select id from properties where name = '" + name + "'"));
    };
    const auto readsFormer = HasSubstr("select id, hex(name) as name, hex(value) as value, protect from properties");
    const std::string begin = R"({"optionalArguments":{"variant":"getConfig"},"configuration":{"properties":[)";
    const std::string others = R"({"_newid_":true,"name":"fresh","value":"x"},{"_id_":")" +
                               std::to_string(idOf("default_language")) + R"(","value":"fr"})";
    const std::string camera =
        R"(],"cameras":[{"_id_":")" + SampleRoot::uuidOf("camera", "Roof") + R"(","access_control_enabled":true}]}})";
    ASSERT_EQ(daemon.connect().post("/v1/lumio/writeSettings", begin + others + camera).status, 200);
    EXPECT_THAT(recorded(), Not(Contains(readsFormer)));
    const int sender = idOf("mail_sender");
    const int language = idOf("default_language");
    std::filesystem::remove(record);
    ASSERT_EQ(daemon.connect()
                  .post("/v1/lumio/writeSettings", begin + R"({"_id_":")" + std::to_string(sender) +
                                                       R"(","_obsoleteid_":true},{"_id_":")" +
                                                       std::to_string(language) + R"(","_obsoleteid_":true})" + camera)
                  .status,
              200);
    const std::vector<std::string> statements = recorded();
    EXPECT_THAT(statements, Contains(readsFormer).Times(1));
    const auto former = std::find_if(statements.begin(), statements.end(), [](const std::string& statement) {
        return statement.find(" where id in (") != std::string::npos;
    });
    const auto removal = std::find_if(statements.begin(), statements.end(), [](const std::string& statement) {
        return statement.starts_with("delete from properties");
    });
    ASSERT_NE(removal, statements.end());
    EXPECT_LT(former, removal);
    EXPECT_EQ(*former, "select id, hex(name) as name, hex(value) as value, protect from properties where id in (" +
                           std::to_string(sender) + ", " + std::to_string(language) + ")");
}

TEST_F(NeededReads, CameraIsChangedWithoutWorkflowsAndProperties) {
    const std::vector<std::string> statements = statementsOf({"camera", "allow", "Roof", "anna"});
    EXPECT_THAT(statements, AllOf(readsCameras, Not(readsWorkflows), Not(readsProperties)));
    EXPECT_EQ(statementsOf({"--names", "camera", "list"}).size(), statementsOf({"camera", "list"}).size());
}

}  // namespace
}  // namespace adminhost::test
