// A change of the path of the settings files: one apply carries out everything that the plan shows.

#include "platform/json/Json.h"
#include "tests/system/apply/ControlledService.h"

#include <filesystem>
#include <future>

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

class Moving : public ControlledService {
  protected:
    void replaceSetting(const std::string& key, const std::string& value) {
        const std::size_t at = _text.find("\n" + key + " = ") + 1;
        ASSERT_NE(at, 0U) << key;
        _text.replace(at, _text.find('\n', at) - at, key + " = " + value);
    }
    /// Applies the file twice: the second time nothing differs, and the exported state equals the file.
    void settlesAtOnce() {
        const std::string desired = file("desired.toml", _text);
        const ProgramResult plan = ctl({"plan", desired});
        EXPECT_EQ(plan.status, 0) << plan.output;
        const ProgramResult apply = ctl({"apply", desired});
        EXPECT_EQ(apply.status, 0) << apply.output;
        EXPECT_THAT(apply.output, Not(HasSubstr("not applied")));
        EXPECT_EQ(ctl({"apply", desired}).output, "no change\n");
        EXPECT_EQ(exported(), _text);
    }
    /// The exported file, which manages the identity of the host too.
    [[nodiscard]] std::string exported() const {
        std::string text = ctl({"export"}).output;
        for (const char* const key : {"member_uuid", "server_host", "tunnel_agent_host"}) {
            const std::size_t at = text.find(std::string("\n# ") + key + " = ");
            EXPECT_NE(at, std::string::npos) << key << " is a comment";
            text.erase(at + 1, 2);
        }
        return text;
    }

    /// Lets the new shared file system have the workflow bundles, whose names are comments in the file.
    void linkWorkflows() const {
        std::filesystem::create_directories(root.disk("/Library/Moved"));
        std::filesystem::create_directory_symlink("../SorvaneProducer/Shared/Workflows",
                                                  root.disk("/Library/Moved/Workflows"));
    }

    std::string _text = exported();
};

TEST_F(Moving, AnotherSharedFileSystemGetsEverySettingOfTheFileInOneApply) {
    linkWorkflows();
    replaceSetting("shared_filesystem", "\"/Library/Moved\"");
    settlesAtOnce();
    const std::string cluster = read(root.path() + "/Library/Moved/Server/cluster_preferences.plist");
    EXPECT_THAT(cluster, AllOf(HasSubstr("nimbo_controller"), HasSubstr("grid1.example.org")));
}

TEST_F(Moving, AnotherMemberGetsEverySettingOfTheMembersFileInOneApply) {
    replaceSetting("member_uuid", "\"0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1EFF\"");
    settlesAtOnce();
    EXPECT_THAT(read(root.path() + "/Library/SorvaneProducer/Shared/Server/"
                                   "member_preferences_0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1EFF.plist"),
                HasSubstr("<integer>8170</integer>"));
}

TEST_F(Moving, ListsAreChangedTogetherWithTheMove) {
    linkWorkflows();
    replaceSetting("shared_filesystem", "\"/Library/Moved\"");
    replaceSetting("server_port", "8180");
    const std::size_t at = _text.find("value = \"de\"");
    ASSERT_NE(at, std::string::npos);
    _text.replace(at, 12, "value = \"fr\"");
    settlesAtOnce();
    EXPECT_EQ(root.sql("select value from properties where name='default_language'"), "fr\n");
}

TEST_F(Moving, BothStepsAreOneDocumentForPrograms) {
    replaceSetting("shared_filesystem", "\"/Library/Moved\"");
    const std::size_t at = _text.find("value = \"de\"");
    ASSERT_NE(at, std::string::npos);
    _text.replace(at, 12, "value = \"fr\"");
    const ProgramResult apply = ctl({"--format", "json", "apply", file("desired.toml", _text)});
    EXPECT_EQ(apply.status, 0);
    const auto document = parseJson(apply.output);
    ASSERT_TRUE(document) << apply.output;
    EXPECT_THAT(apply.output, AllOf(HasSubstr("\"shared_filesystem\""), HasSubstr("\"default_language\"")));
}

TEST_F(Moving, ListsAreNotChangedWhenTheStateIsNotReadCompletelyAfterTheMove) {
    replaceSetting("member_uuid", "\"0E6F2C1A-6B0B-4F2E-9C35-3A1F0C7A1EFF\"");
    const std::size_t at = _text.find("value = \"de\"");
    ASSERT_NE(at, std::string::npos);
    _text.replace(at, 12, "value = \"fr\"");
    const std::string desired = file("desired.toml", _text);
    holdWrite();
    std::future<ProgramResult> apply = std::async(std::launch::async, [&] { return ctl({"apply", desired}); });
    waitForWrite();
    root.sql("alter table access_control_entries rename to gone");
    releaseWrite();
    const ProgramResult result = apply.get();
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, HasSubstr("parts of the state could not be read:\n  not read: the access list ("));
    EXPECT_EQ(root.sql("select value from properties where name='default_language'"), "de\n");
}

TEST_F(Moving, PlanNamesWhatTheNewFilesNeedNotHave) {
    const ProgramResult plan = ctl({"plan", file("some.toml", "[settings]\nshared_filesystem = \"/Library/Moved\"\n")});
    EXPECT_THAT(plan.output, AllOf(HasSubstr("settings: read from other files then, which may not have them: "),
                                   HasSubstr("server_port"),
                                   HasSubstr("settings.nimbo_client_password: a secret, read from another file then")));
}

}  // namespace
}  // namespace adminhost::test
