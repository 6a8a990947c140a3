// Desired states in several files, for several hosts: which file wins, which sections count, and names and secrets that
// are checked before anything is written.

#include "tests/system/apply/ControlledService.h"

#include <filesystem>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

class SeveralFiles : public ControlledService {
  protected:
    /// Both verbs refuse these files in the same words, and nothing is written.
    [[nodiscard]] std::string refusal(const std::vector<std::string>& words, int status = 2) const {
        std::vector<std::string> plan{"plan"};
        plan.insert(plan.end(), words.begin(), words.end());
        std::vector<std::string> apply = plan;
        apply.front() = "apply";
        const ProgramResult planned = ctl(plan);
        const ProgramResult applied = ctl(apply);
        EXPECT_EQ(planned.status, status) << planned.output;
        EXPECT_EQ(applied.status, status) << applied.output;
        EXPECT_EQ(planned.output, applied.output);
        EXPECT_EQ(ctl({"history"}).output, "No change has been recorded yet.\n");
        return applied.output;
    }
    [[nodiscard]] std::string secretFile(const std::string& name, const std::string& content) const {
        const std::string path = file(name, content);
        fs::permissions(path, fs::perms(0600));
        return path;
    }
};

TEST_F(SeveralFiles, LaterOnesWinKeyByKeyAndListsAsAWhole) {
    const std::string hall = SampleRoot::uuidOf("camera", "Main hall");
    const std::string base =
        file("base.toml",
             "[remove_unlisted]\naccess = true\n[settings]\nserver_port = 8180\ntunnel_server_port = 9000\n"
             "[properties.default_language]\nvalue = \"fr\"\nprotect = false\n"
             "[cameras.\"Main hall\"]\naccess_control = true\nusers = [\"ben\", \"carla\"]\ngroups = [\"studio\"]\n");
    const std::string host = file("host2.toml",
                                  "[settings]\nserver_port = 8190\n[properties.default_language]\nvalue = "
                                  "\"en\"\n[cameras." +
                                      hall + "]\nusers = [\"anna\"]\n");
    const ProgramResult apply = ctl({"apply", base, host});
    EXPECT_EQ(apply.status, 0) << apply.output;
    EXPECT_THAT(apply.output,
                AllOf(HasSubstr("settings.server_port: 8170 -> 8190: applied\n"),
                      HasSubstr("settings.tunnel_server_port: "), HasSubstr("value: \"de\" -> \"en\": applied\n"),
                      HasSubstr("groups.studio: (not allowed) -> (allowed): applied\n"),
                      HasSubstr("groups.lecturers: (allowed) -> (not allowed): applied\n"), Not(HasSubstr("ben")),
                      Not(HasSubstr("carla")), Not(HasSubstr("users.anna"))));
    EXPECT_EQ(root.sql("select value from properties where name = 'default_language'"), "en\n");
    EXPECT_EQ(ctl({"apply", base, host}).output, "no change\n");
    EXPECT_THAT(ctl({"plan", host, base}).output, HasSubstr("settings.server_port: 8190 -> 8180\n")) << "the last one";
}

TEST_F(SeveralFiles, SwitchOfALaterFileCountsAndAnElementOfAnyFileIsListed) {
    const std::string base =
        file("base.toml", "[remove_unlisted]\nproperties = true\n[properties.default_language]\nvalue = \"de\"\n");
    const std::string other = file("other.toml", "[properties.mail_sender]\n");
    const ProgramResult both = ctl({"plan", base, other});
    EXPECT_EQ(both.status, 0) << both.output;
    EXPECT_THAT(both.output, AllOf(HasSubstr(" -> (removed)\n"), Not(HasSubstr("properties.mail_sender:")),
                                   Not(HasSubstr("properties.default_language"))));
    const std::string off = file("off.toml", "[remove_unlisted]\nproperties = false\n");
    EXPECT_EQ(ctl({"plan", base, off}).output, "no change\n");
}

TEST_F(SeveralFiles, MistakeNamesItsFileWithLineAndColumn) {
    const std::string good = file("good.toml", "[settings]\nserver_port = 8180\n");
    EXPECT_THAT(refusal({good, file("bad.toml", "[settings]\n\nserver_port = \"x\"\n")}),
                HasSubstr("bad.toml, line 3, column 15: settings.server_port must be a whole number"));
    EXPECT_THAT(refusal({file("broken.toml", "[settings\n"), good}), HasSubstr("broken.toml, line 1, column "));
    EXPECT_THAT(refusal({good, file("new.toml", "\n[properties.fresh]\nprotect = true\n")}),
                HasSubstr("new.toml, line 2, column 1: properties.fresh: not found, and adding it needs a value"));
    EXPECT_THAT(refusal({good, root.directory() + "/missing.toml"}), HasSubstr("missing.toml: No such file"));
}

TEST_F(SeveralFiles, OnlyTheChosenSectionsAreReadAndChanged) {
    const std::string all = file("all.toml",
                                 "[remove_unlisted]\nproperties = true\naccess = true\n[settings]\nserver_port = 8180\n"
                                 "[properties.default_language]\nvalue = \"fr\"\n[cameras.Elsewhere]\nusers = "
                                 "[\"nobody-of-that-name\"]\n");
    const ProgramResult settings = ctl({"plan", all, "--only", "settings"});
    EXPECT_EQ(settings.output, "settings.server_port: 8170 -> 8180\n");
    const ProgramResult two = ctl({"apply", all, "--only", "settings,properties"});
    EXPECT_EQ(two.status, 0) << two.output;
    EXPECT_EQ(root.sql("select name, value from properties"), "default_language|fr\n");
    EXPECT_EQ(ctl({"apply", all, "--only", "properties"}).output, "no change\n");
    EXPECT_EQ(ctl({"apply", all}).status, 2) << "no such camera";
    root.sql("alter table cameras rename to gone");
    EXPECT_EQ(ctl({"apply", all, "--only", "settings"}).output, "no change\n") << "which has nothing to do with them";
}

TEST_F(SeveralFiles, UnknownSectionIsRefusedWithTheKnownOnes) {
    const std::string port = file("port.toml", "[settings]\nserver_port = 8180\n");
    EXPECT_THAT(refusal({port, "--only", "setings"}),
                HasSubstr("--only: not a section: setings; did you mean \"settings\"?; the sections are settings, "));
    EXPECT_THAT(refusal({port, "--only", ""}), HasSubstr("--only: the name of a section is missing"));
    EXPECT_THAT(refusal({port, "--only", "cameras", "--password-file", secretFile("password", "x")}),
                HasSubstr("--only leaves out the settings"));
}

TEST_F(SeveralFiles, ValueOfAPropertyComesFromAFileBesideTheToml) {
    fs::create_directory(root.directory() + "/site");
    fs::create_directory(root.directory() + "/site/secrets");
    (void)secretFile("site/secrets/token", "planted-token\n");
    const std::string desired = file("site/host.toml",
                                     "[properties.new_token]\nvalue_file = \"secrets/token\"\nprotect = true\n"
                                     "[properties.plain]\nvalue_file = \"secrets/token\"\n");
    for (const std::string verb : {"plan", "apply"}) {
        const ProgramResult result = ctl({verb, desired, "--only", "properties"});
        EXPECT_EQ(result.status, 0) << result.output;
        EXPECT_THAT(result.output, HasSubstr("properties.new_token: (not present) -> (secret)"));
    }
    EXPECT_EQ(root.sql("select value from properties where name = 'plain'"), "planted-token\n");
    EXPECT_EQ(root.sql("select protect, value = 'planted-token' from properties where name = 'new_token'"), "t|0\n");
    EXPECT_THAT(ctl({"apply", desired}).output, HasSubstr("no change\nproperties.new_token.value: (secret)"));
    EXPECT_EQ(ctl({"apply", desired, file("later.toml", "[properties.plain]\nvalue = \"public\"\n")}).status, 0);
    EXPECT_EQ(root.sql("select value from properties where name = 'plain'"), "public\n");
}

TEST_F(SeveralFiles, FileOfAValueThatCannotBeUsedIsNamedWithItsPlace) {
    const std::string begin = "[properties.token]\nvalue_file = ";
    EXPECT_THAT(refusal({file("host.toml", begin + "\"missing\"\n")}),
                AllOf(HasSubstr("host.toml, line 2, column 14: properties.token.value_file cannot be used: "),
                      HasSubstr("/missing: No such file or directory")));
    (void)file("open", "planted-token");
    EXPECT_THAT(
        refusal({file("host.toml", begin + "\"open\"\n")}),
        AllOf(HasSubstr("/open: group or others have access; set its mode to 0600"), Not(HasSubstr("planted-token"))));
    EXPECT_THAT(refusal({file("host.toml", begin + "\"" + secretFile("empty", "\n") + "\"\n")}),
                HasSubstr("/empty: the file is empty"));
    EXPECT_THAT(refusal({file("host.toml", begin + "\"/dev/null\"\n")}), HasSubstr("/dev/null: not a regular file"));
    EXPECT_THAT(refusal({file("host.toml", begin + "\"x\"\nvalue = \"y\"\n")}),
                HasSubstr("is the same as value, of which only one can be given"));
    EXPECT_THAT(refusal({file("host.toml", "[settings]\nserver_host_file = \"x\"\n")}), HasSubstr("is not a setting"));
}

TEST_F(SeveralFiles, NamesThatTheDirectoryDoesNotHaveAreRefusedWithTheirPlaces) {
    const std::string message =
        refusal({file("base.toml", "[settings]\nserver_port = 8180\n"),
                 file("people.toml",
                      "[cameras.\"Main hall\"]\nusers = [\"anna\", \"ana\", \"studio\"]\n"
                      "groups = [\n  \"lecturers\",\n  \"ben\",\n]\n[workflows." +
                          SampleRoot::uuidOf("workflow", "Archive.workflow") + "]\nusers = [\"nobody-here\", \"" +
                          SampleRoot::uuidOf("user", "ben") + "\"]\n")});
    EXPECT_THAT(message, HasSubstr("people.toml, line 2, column 18: person not found: ana; did you mean \"anna\"?\n"));
    EXPECT_THAT(message, HasSubstr("people.toml, line 2, column 25: studio is a group: write it in groups\n"));
    EXPECT_THAT(message, HasSubstr("people.toml, line 5, column 3: ben is a person: write it in users\n"));
    EXPECT_THAT(message, HasSubstr("people.toml, line 8, column 10: person not found: nobody-here\n"));
    EXPECT_THAT(message, HasSubstr("people.toml, line 8, column 25: write the short name ben\n"));
}

TEST_F(SeveralFiles, PlanRefusesWhatApplyWouldBeRefusedFor) {
    EXPECT_THAT(refusal({file("path.toml", "[settings]\nshared_filesystem = \"relative/path\"\n")}, 1),
                HasSubstr("configuration.shared_filesystem: must be an absolute path"));
    EXPECT_THAT(refusal({file("name.toml", "[properties.\"a\\\"b\"]\nvalue = \"x\"\n")}, 1),
                HasSubstr("configuration.properties.0.name"));
    EXPECT_THAT(refusal({file("range.toml", "[settings]\nserver_port = 99999\n")}), HasSubstr("is above 65534"));
    EXPECT_THAT(refusal({file("empty.toml", ""), "--password-file", "/dev/null"}), HasSubstr("the value is empty"));
}

TEST_F(SeveralFiles, ExitCodeDistinguishesNothingToDoFromSomething) {
    const std::string port = file("port.toml", "[settings]\nserver_port = 8180\n");
    EXPECT_EQ(ctl({"plan", port}).status, 0);
    EXPECT_EQ(ctl({"plan", port, "--exit-code"}).status, 5);
    EXPECT_EQ(ctl({"apply", port, "--exit-code", "--dry-run"}).status, 5);
    EXPECT_EQ(ctl({"apply", port, "--exit-code"}).status, 5);
    EXPECT_EQ(ctl({"apply", port, "--exit-code"}).status, 0);
    EXPECT_EQ(ctl({"plan", port, "--exit-code"}).status, 0);
    root.setSwitch("lumioconfig.exit", "3");
    EXPECT_EQ(ctl({"apply", file("ben.toml", "[cameras.Roof]\nusers = [\"ben\"]\n"), "--exit-code"}).status, 1);
}

TEST_F(SeveralFiles, IdentityOfTheHostIsExportedAsCommentsAndMayBeManaged) {
    const std::string text = ctl({"export"}).output;
    EXPECT_THAT(text, AllOf(HasSubstr("\n# member_uuid = \""), HasSubstr("\n# server_host = \"media1.example.org\"\n"),
                            HasSubstr("\n# tunnel_agent_host = \"localhost\"\n"),
                            HasSubstr("\ntunnel_server_host = \"tunnel.example.org\"\n")));
    EXPECT_THAT(ctl({"plan", file("state.toml", text)}).output, testing::StartsWith("no change\n"));
    EXPECT_THAT(ctl({"plan", file("own.toml", "[settings]\nserver_host = \"media2.example.org\"\n")}).output,
                HasSubstr("settings.server_host: \"media1.example.org\" -> \"media2.example.org\"\n"));
}

TEST_F(SeveralFiles, NoteAboutThePasswordIsOnlyForFilesWithItsAccountOrController) {
    const std::string note = "settings.nimbo_client_password: unknown and not compared";
    EXPECT_THAT(ctl({"plan", file("port.toml", "[settings]\nserver_port = 8180\n")}).output, Not(HasSubstr(note)));
    EXPECT_THAT(ctl({"plan", file("people.toml", "[cameras.Roof]\nusers = [\"ben\"]\n")}).output, Not(HasSubstr(note)));
    const std::string account = file("account.toml", "[settings]\nnimbo_client_username = \"lumiogrid\"\n");
    EXPECT_THAT(ctl({"plan", account}).output, HasSubstr(note));
    EXPECT_THAT(ctl({"plan", account, "--only", "cameras"}).output, Not(HasSubstr(note)));
    EXPECT_THAT(ctl({"plan", account, "--password-file", secretFile("password", "x")}).output, Not(HasSubstr(note)));
}

}  // namespace
}  // namespace adminhost::test
