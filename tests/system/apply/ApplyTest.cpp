// The desired state as a file: exported, planned and applied on the sample service.

#include "tests/system/apply/ControlledService.h"

#include <filesystem>
#include <iterator>
#include <thread>

#include <sys/stat.h>

namespace adminhost::test {
namespace {

namespace fs = std::filesystem;
using testing::HasSubstr;
using testing::Not;

class Apply : public ControlledService {
  protected:
    /// Exports a file, replaces each text and returns the file's path.
    [[nodiscard]] std::string changed(const std::vector<std::pair<std::string, std::string>>& replacements) const {
        std::string text = ctl({"export"}).output;
        for (const auto& [from, to] : replacements) {
            const std::size_t at = text.find(from);
            EXPECT_NE(at, std::string::npos) << from << "\n" << text;
            text.replace(at, from.size(), to);
        }
        return file("desired.toml", text);
    }
    /// The message with which a file with this text is rejected. Nothing may be sent.
    [[nodiscard]] std::string refusal(const std::string& text) const {
        const ProgramResult apply = ctl({"apply", file("bad.toml", text)});
        EXPECT_EQ(apply.status, 2) << apply.output;
        EXPECT_EQ(ctl({"history"}).output, "No change has been recorded yet.\n");
        return apply.output;
    }
};

TEST_F(Apply, ExportedStateIsNoChange) {
    const std::string exported = root.directory() + "/state.toml";
    EXPECT_EQ(ctl({"export", exported}).status, 0);
    EXPECT_EQ(read(exported), ctl({"export"}).output) << "the same state is the same text";
    EXPECT_THAT(ctl({"plan", exported}).output, testing::StartsWith("no change\n"));
    const ProgramResult apply = ctl({"apply", exported});
    EXPECT_EQ(apply.status, 0);
    EXPECT_EQ(apply.output, "no change\n");
    EXPECT_EQ(ctl({"history"}).output, "No change has been recorded yet.\n");
}

TEST_F(Apply, NamesThatNeedQuotesOrAreNotUniqueAreExportedSoThatNothingChanges) {
    root.sql(
        "update cameras set name='Hall \"A\".[1] é' where name='Studio A';"
        "update cameras set name='Main hall' where name='Studio B';"
        "insert into properties (name, value, protect) values ('remove_unlisted', 'x', 'f');"
        "insert into properties (name, value, protect) values ('twice', 'a', 'f');"
        "insert into properties (name, value, protect) values ('twice', 'b', 'f');");
    const std::string text = ctl({"export"}).output;
    EXPECT_THAT(text, HasSubstr("[cameras.\"Hall \\\"A\\\".[1] é\"]"));
    EXPECT_THAT(text, HasSubstr("[cameras." + SampleRoot::uuidOf("camera", "Main hall") + "]"));
    EXPECT_THAT(text, HasSubstr("[properties.remove_unlisted]"));
    EXPECT_THAT(text, HasSubstr("# properties.twice, "));
    EXPECT_THAT(ctl({"plan", file("state.toml", text)}).output, testing::StartsWith("no change\n"));
}

TEST_F(Apply, ChangesAreShownAppliedReadBackAndThenSettled) {
    const std::string desired = changed({{"server_port = 8170", "server_port = 8180"},
                                         {"submissions_groupname = \"lecturers\"", "submissions_groupname = \"staff\""},
                                         {"nimbo_client_username = \"lumiogrid\"", "nimbo_client_username = \"other\""},
                                         {"value = \"de\"", "value = \"fr\""},
                                         {"users = [\"anna\"]", "users = [\"anna\", \"ben\"]"}});
    const ProgramResult plan = ctl({"plan", desired});
    EXPECT_EQ(plan.status, 0);
    for (const char* const line :
         {"settings.server_port: 8170 -> 8180\n", "settings.submissions_groupname: \"lecturers\" -> \"staff\"\n",
          "settings.nimbo_client_username: \"lumiogrid\" -> \"other\"\n",
          "properties.default_language.value: \"de\" -> \"fr\"\n", "has to be restarted",
          ".users.ben: (not allowed) -> (allowed)\n", "nimbo_client_password: unknown"}) {
        EXPECT_THAT(plan.output, HasSubstr(line));
    }
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8170\n") << "a plan writes nothing";

    const ProgramResult apply = ctl({"apply", desired});
    EXPECT_EQ(apply.status, 0) << apply.output;
    EXPECT_THAT(apply.output, HasSubstr("adminhostctl stopService, then startService")) << "recycling does nothing";
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8180\n");
    EXPECT_EQ(root.sql("select value from properties where name='default_language'"), "fr\n");
    EXPECT_EQ(ctl({"apply", desired}).output, "no change\n");
    EXPECT_EQ(ctl({"export"}).output, read(desired)) << "what was applied is what is exported";
}

TEST_F(Apply, FileOfAStateThatAnotherClientChangedMeanwhileIsRefusedAndNothingIsWritten) {
    const std::string text = ctl({"export"}).output;
    const std::string desired = root.directory() + "/desired.pipe";
    ASSERT_EQ(::mkfifo(desired.c_str(), 0600), 0);
    ProgramResult apply;
    std::thread applying([&] { apply = ctl({"apply", desired}); });
    {
        // Opening waits until the command line reads the file, which it does after it has read the service's state.
        std::ofstream file(desired);
        EXPECT_EQ(ctl({"settings", "set", "tunnel_server_port", "9999"}).status, 0) << "the other client";
        std::string other = text;
        other.replace(other.find("server_port = 8170"), 18, "server_port = 8180");
        file << other;
    }
    applying.join();
    EXPECT_EQ(apply.status, 7);
    EXPECT_THAT(apply.output, HasSubstr("have changed since they were read"));
    EXPECT_THAT(apply.output, HasSubstr("REVISION_CHANGED"));
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8170\n");
    EXPECT_EQ(ctl({"settings", "get", "tunnel_server_port"}).output, "9999\n");
    EXPECT_THAT(ctl({"history"}).output, Not(HasSubstr("8180"))) << "a refused write has no entry";
}

TEST_F(Apply, ExportedFileIsTheOwnersAloneAndReplacesTheOldOneAsAWhole) {
    const std::string place = root.directory() + "/exported";
    fs::create_directory(place);
    const std::string path = place + "/state.toml";
    EXPECT_EQ(ctl({"export", path}).status, 0);
    EXPECT_EQ(fs::status(path).permissions(), fs::perms(0600));
    EXPECT_EQ(read(path), ctl({"export"}).output);

    std::ofstream(path) << "old";
    fs::permissions(path, fs::perms(0640));
    fs::create_hard_link(path, place + "/same");
    fs::create_symlink(path, place + "/link");
    EXPECT_EQ(ctl({"export", place + "/link"}).status, 0);
    EXPECT_EQ(read(place + "/same"), "old") << "the old file was not written to";
    EXPECT_EQ(read(path), ctl({"export"}).output);
    EXPECT_TRUE(fs::is_symlink(place + "/link"));
    EXPECT_EQ(fs::status(path).permissions(), fs::perms(0640)) << "as its owner wants it";
    EXPECT_EQ(std::distance(fs::directory_iterator(place), fs::directory_iterator()), 3) << "nothing else is left";
}

TEST_F(Apply, ExportIntoAPipeIsWrittenToItAndOneThatCannotBeWrittenIsSaid) {
    const std::string pipe = root.directory() + "/export.pipe";
    ASSERT_EQ(::mkfifo(pipe.c_str(), 0600), 0);
    std::string piped;
    std::thread reader([&] { piped = read(pipe); });
    EXPECT_EQ(ctl({"export", pipe}).status, 0);
    reader.join();
    EXPECT_EQ(piped, ctl({"export"}).output);
    EXPECT_TRUE(fs::is_fifo(pipe));

    const ProgramResult nowhere = ctl({"export", root.directory() + "/missing/state.toml"});
    EXPECT_EQ(nowhere.status, 2);
    EXPECT_THAT(nowhere.output, HasSubstr("missing/state.toml: No such file or directory"));
    EXPECT_EQ(ctl({"export", root.directory()}).status, 2);
}

TEST_F(Apply, UnlistedOnesAreRemovedOnlyWhenTheSwitchIsOn) {
    const std::string some = "[properties.default_language]\nvalue = \"de\"\n[cameras.\"Main hall\"]\nusers = []\n";
    EXPECT_EQ(ctl({"apply", file("some.toml", some)}).output, "no change\n");
    const ProgramResult apply =
        ctl({"apply", file("only.toml", "[remove_unlisted]\nproperties = true\naccess = true\n" + some)});
    EXPECT_EQ(apply.status, 0) << apply.output;
    EXPECT_THAT(apply.output, HasSubstr("cameras.\"Main hall\".users.anna: (allowed) -> (not allowed)"));
    EXPECT_THAT(apply.output, Not(HasSubstr("groups.lecturers"))) << "that list is not given";
    EXPECT_EQ(root.sql("select name from properties"), "default_language\n");
}

TEST_F(Apply, ConfigurationToolThatFailsIsNamedAndTheRestIsApplied) {
    root.setSwitch("lumioconfig.exit", "3");
    const ProgramResult apply =
        ctl({"apply",
             changed({{"server_port = 8170", "server_port = 8180"}, {"users = [\"anna\"]", "users = [\"ben\"]"}})});
    EXPECT_EQ(apply.status, 1);
    EXPECT_THAT(apply.output, testing::ContainsRegex("cameras\\.[^\n]*\\.users\\.ben: [^\n]*: FAILED: "));
    EXPECT_THAT(apply.output, HasSubstr("settings.server_port: 8170 -> 8180: applied\n"));
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8180\n");
}

TEST_F(Apply, ProtectedValueIsNeverPrintedAndAppliedOnce) {
    const std::string desired =
        file("secret.toml", "[properties.new_token]\nvalue = \"planted-token\"\nprotect = true\n");
    for (const std::string verb : {"plan", "apply", "apply", "plan"}) {
        const ProgramResult result = ctl({verb, desired});
        EXPECT_EQ(result.status, 0) << result.output;
        EXPECT_THAT(result.output, Not(HasSubstr("planted-token")));
    }
    EXPECT_THAT(ctl({"apply", desired}).output, HasSubstr("no change\nproperties.new_token.value: (secret)"));
    EXPECT_THAT(ctl({"export"}).output, Not(HasSubstr("planted-token")));
    EXPECT_THAT(ctl({"export"}).output, HasSubstr("[properties.new_token]\n# value = (secret)\nprotect = true\n"));
    EXPECT_THAT(daemon.log(), Not(HasSubstr("planted-token")));
}

TEST_F(Apply, PasswordIsReadFromItsFileAndShownNowhere) {
    const std::string desired = changed({});
    const ProgramResult apply = ctl({"apply", desired, "--password-file", file("password", "planted-password\n")});
    EXPECT_EQ(apply.status, 0);
    EXPECT_EQ(apply.output, "settings.nimbo_client_password: (secret) -> (secret): applied\n");
    EXPECT_THAT(daemon.log(), Not(HasSubstr("planted-password")));
    EXPECT_THAT(read(root.clusterPreferencesPath()), Not(HasSubstr("planted-password")));
}

TEST_F(Apply, ControllerNameThatAWriteResolvesIsNotedAndNotAChange) {
    const std::string desired =
        changed({{"nimbo_controller = \"grid1.example.org\"", "nimbo_controller = \"studio.local\""}});
    const ProgramResult apply = ctl({"apply", desired});
    EXPECT_EQ(apply.status, 0);
    EXPECT_THAT(apply.output, HasSubstr("no change\nsettings.nimbo_controller: \"studio.local\" is looked up"));
}

TEST_F(Apply, FileThatDoesNotFitIsRefusedWithItsPlaceAndNothingIsSent) {
    EXPECT_THAT(refusal("[settings]\nserver_port = \n"), HasSubstr("bad.toml, line 2, column"));
    EXPECT_THAT(refusal("[settings]\nserver_port = \"x\"\n"),
                HasSubstr("line 2, column 15: settings.server_port must be a whole number"));
    EXPECT_THAT(refusal("[settings]\nno_such = 1\n"), HasSubstr("settings.no_such is not a setting"));
    EXPECT_THAT(refusal("[settings]\nnimbo_client_password = \"x\"\n"), HasSubstr("--password-file"));
    EXPECT_THAT(refusal("[sessions]\n"), HasSubstr("sessions is unknown"));
    EXPECT_THAT(refusal("settings = 1\n"), HasSubstr("settings must be a table"));
    EXPECT_THAT(refusal("[remove_unlisted]\nsettings = true\n"), HasSubstr("remove_unlisted.settings is unknown"));
    EXPECT_THAT(refusal("[properties.x]\nvalue = 1\n"), HasSubstr("properties.x.value must be a text"));
    EXPECT_THAT(refusal("[properties.x]\nprotect = true\n"),
                HasSubstr("properties.x: not found, and adding it needs a value"));
    EXPECT_THAT(refusal("[cameras.Nowhere]\nusers = []\n"), HasSubstr("cameras.Nowhere not found"));
    EXPECT_THAT(refusal("[cameras.\"Main hall\"]\nusers = \"anna\"\n"), HasSubstr("must be a list of names"));
    EXPECT_THAT(refusal("[cameras.\"Main hall\"]\n[cameras." + SampleRoot::uuidOf("camera", "Main hall") + "]\n"),
                HasSubstr("is in the file twice"));
    EXPECT_EQ(ctl({"plan", root.directory() + "/missing.toml"}).status, 2);
}

}  // namespace
}  // namespace adminhost::test
