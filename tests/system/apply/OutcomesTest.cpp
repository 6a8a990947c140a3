// What a change prints and does beside writing: documents for programs, dry runs, ranges, and other clients' changes.

#include "platform/json/Json.h"
#include "tests/system/apply/OvertakenService.h"

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::EndsWith;
using testing::HasSubstr;
using testing::Not;

class Outcomes : public OvertakenService {
  protected:
    /// The changes in the document that a verb prints for programs.
    static Array changesOf(const std::string& output) {
        const auto document = parseJson(output);
        EXPECT_TRUE(document) << output;
        const Array* changes = document ? document->dictionary()->get("changes").array() : nullptr;
        return changes != nullptr ? *changes : Array();
    }
};

TEST_F(Outcomes, ChangesAreTypedForProgramsWithOutcomeAndReason) {
    root.setSwitch("lumioconfig.exit", "3");
    const ProgramResult apply = ctl({"--format", "json", "apply",
                                     file("desired.toml",
                                          "[settings]\nserver_port = 8180\n[properties.default_language]\nvalue = "
                                          "\"fr\"\n[cameras.\"Main hall\"]\nusers = [\"ben\"]\n")});
    const std::string document = apply.output.substr(apply.output.find("{\n"));
    const Array changes = changesOf(document);
    ASSERT_EQ(changes.size(), 3U) << document;
    EXPECT_EQ(changes[0], Value(Dictionary{{"section", "settings"},
                                           {"name", ""},
                                           {"key", "server_port"},
                                           {"from", 8170},
                                           {"to", 8180},
                                           {"secret", false},
                                           {"applied", true}}));
    EXPECT_EQ(changes[1].dictionary()->text("name"), "default_language");
    EXPECT_EQ(changes[1].dictionary()->text("key"), "value");
    EXPECT_EQ(changes[1].dictionary()->get("to"), Value("fr"));
    const Dictionary& person = *changes[2].dictionary();
    EXPECT_EQ(person.text("section"), "cameras");
    EXPECT_EQ(person.text("name"), "Main hall");
    EXPECT_EQ(person.text("key"), "users");
    EXPECT_FALSE(person.contains("from"));
    EXPECT_EQ(person.get("to"), Value("ben"));
    EXPECT_EQ(person.get("applied"), Value(false));
    EXPECT_THAT(std::string(person.text("reason")), HasSubstr("not added"));
    EXPECT_EQ(apply.status, 1);
}

TEST_F(Outcomes, DryRunOfEveryVerbShowsTheChangeAndWritesNothing) {
    root.recordToolCalls();
    const std::string before = root.sql("select * from cameras; select * from properties");
    const std::string toml = file("desired.toml", "[settings]\nserver_port = 8180\n");
    for (const auto& [words, line] : std::vector<std::pair<std::vector<std::string>, std::string>>{
             {{"settings", "set", "server_port", "8180"}, "settings.server_port: 8170 -> 8180\n"},
             {{"property", "set", "colour", "blue"}, "properties.colour: (not present) -> \"blue\"\n"},
             {{"property", "remove", "default_language"}, "properties.default_language: \"de\" -> (removed)\n"},
             {{"camera", "allow", "Main hall", "ben"}, "users.ben: (not allowed) -> (allowed)\n"},
             {{"camera", "deny", "Main hall", "anna"}, "users.anna: (allowed) -> (not allowed)\n"},
             {{"camera", "access", "Main hall", "off"}, "access_control: yes -> no\n"},
             {{"access", "anna", "--revoke"}, ".users.anna: (allowed) -> (not allowed)\n"},
             {{"camera", "remove", "Studio A"}, "(present) -> (removed)\n"},
             {{"apply", toml}, "settings.server_port: 8170 -> 8180\n"},
             {{"writeSettings", "configuration.server_port=8180"}, "dry run: writeSettings would be carried out"},
             {{"start"}, "dry run: startService would be carried out"},
             {{"stop"}, "dry run: stopService would be carried out"}}) {
        std::vector<std::string> all = words;
        all.emplace_back("--dry-run");
        const ProgramResult result = ctl(all);
        EXPECT_EQ(result.status, 0) << words[0] << result.output;
        EXPECT_THAT(result.output, HasSubstr(line));
    }
    EXPECT_EQ(root.sql("select * from cameras; select * from properties"), before);
    for (const ToolCall& call : root.toolCalls()) {
        EXPECT_THAT(call.tool, Not(AllOf(EndsWith("lumioconfig"), EndsWith("library"))));
    }
    EXPECT_EQ(ctl({"history"}).output, "No change has been recorded yet.\n");
}

TEST_F(Outcomes, DryRunAndPlanAreRefusedForWhatTheWriteWouldBeRefusedFor) {
    for (const std::vector<std::string>& words :
         {std::vector<std::string>{"settings", "set", "shared_filesystem", "relative/path", "--dry-run"},
          std::vector<std::string>{"plan", file("bad.toml", "[settings]\nshared_filesystem = \"relative/path\"\n")}}) {
        const ProgramResult refused = ctl(words);
        EXPECT_EQ(refused.status, 1) << refused.output;
        EXPECT_THAT(refused.output, HasSubstr("configuration.shared_filesystem: must be an absolute path"));
    }
}

TEST_F(Outcomes, ValueOutsideItsRangeIsWrittenOnlyWithForce) {
    for (const auto& [key, value, text] :
         {std::tuple{"server_port", "99999", "server_port: 99999 is above 65534; --force writes it nevertheless"},
          {"agent_timeout_seconds", "-5", "agent_timeout_seconds: -5 is below 1 s; --force"},
          {"http_auth_type", "magic", "http_auth_type: magic is not one of "}}) {
        const ProgramResult refused = ctl({"settings", "set", key, "--", value});
        EXPECT_EQ(refused.status, 2) << refused.output;
        EXPECT_THAT(refused.output, HasSubstr(text));
        EXPECT_EQ(ctl({"settings", "set", key, "--force", "--", value}).status, 0);
    }
    const std::string path = file("port.toml", "[settings]\nserver_port = 99998\n");
    const ProgramResult apply = ctl({"apply", path});
    EXPECT_EQ(apply.status, 2);
    EXPECT_THAT(apply.output, HasSubstr("line 2, column 15: settings.server_port is above 65534; --force"));
    EXPECT_EQ(ctl({"apply", path, "--force"}).status, 0);
    EXPECT_EQ(ctl({"apply", path}).output, "no change\n") << "a stored value is not refused";
}

TEST_F(Outcomes, UnitsAndUsualWordsAreAcceptedAndShownAsTheyAreTyped) {
    EXPECT_EQ(ctl({"settings", "set", "max_file_size_in_mb", "4096 MB"}).status, 0);
    EXPECT_EQ(ctl({"settings", "get", "max_file_size_in_mb"}).output, "4096 MB\n");
    EXPECT_THAT(ctl({"settings", "set", "max_file_size_in_mb", "8192mb"}).output,
                EndsWith("4096 MB -> 8192 MB: applied\n"));
    EXPECT_EQ(ctl({"settings", "set", "max_file_size_in_mb", "4 GB"}).status, 2);
    for (const char* const word : {"disabled", "enable", "N", "On"}) {
        EXPECT_EQ(ctl({"settings", "set", "sorvane_capture_web_enabled", word}).status, 0) << word;
    }
    EXPECT_EQ(ctl({"camera", "access", "Main hall", "no"}).status, 0);
    EXPECT_EQ(ctl({"settings", "set", "sorvane_capture_web_enabled", "no"}).output,
              "settings.sorvane_capture_web_enabled: yes -> no: applied\n");
}

TEST_F(Outcomes, OtherClientsChangeOfAnotherKeyIsNoObstacle) {
    const ProgramResult set =
        overtaken({"settings", "set", "server_port", "8180"}, R"({"configuration":{"server_host":"other"}})");
    EXPECT_EQ(set.status, 0) << set.output;
    EXPECT_EQ(set.output, "settings.server_port: 8170 -> 8180: applied\n");
    EXPECT_EQ(ctl({"settings", "get", "server_host"}).output, "other\n");
}

TEST_F(Outcomes, OtherClientsChangeOfTheSameKeyIsAConflictAndNothingIsWritten) {
    const ProgramResult set =
        overtaken({"settings", "set", "server_port", "8180"}, R"({"configuration":{"server_port":8190}})");
    EXPECT_EQ(set.status, 7) << set.output;
    EXPECT_THAT(set.output, HasSubstr("settings.server_port: another client has changed it, it is 8190 now"));
    EXPECT_EQ(ctl({"settings", "get", "server_port"}).output, "8190\n");
}

TEST_F(Outcomes, WantedValueThatAnotherClientHasWrittenIsSuccess) {
    const ProgramResult set =
        overtaken({"settings", "set", "server_port", "8180"}, R"({"configuration":{"server_port":8180}})");
    EXPECT_EQ(set.status, 0) << set.output;
    EXPECT_THAT(set.output, HasSubstr("already so: another client has changed it\n"));
}

TEST_F(Outcomes, AccessChangeComparesItsOwnEntryOnly) {
    const std::string hall = SampleRoot::uuidOf("camera", "Main hall");
    const ProgramResult allow =
        overtaken({"camera", "allow", "Main hall", "ben"},
                  R"({"configuration":{"cameras":[{"_id_":")" + hall +
                      R"(","allowedUsersAndGroups":[{"_newid_":true,"type":"user","shortName":"carla"}]}]}})");
    EXPECT_EQ(allow.status, 0) << allow.output;
    EXPECT_THAT(allow.output, HasSubstr("users.ben: (not allowed) -> (allowed): applied\n"));
    EXPECT_THAT(ctl({"camera", "show", "Main hall"}).output, AllOf(HasSubstr("Carla"), HasSubstr("Ben")));
}

TEST_F(Outcomes, StoredSecretIsNotReplacedIfAnotherClientHasChangedSomething) {
    ASSERT_EQ(ctl({"settings", "set", "nimbo_client_password", "@" + file("first", "first")}).status, 0);
    const ProgramResult set =
        overtaken({"settings", "set", "nimbo_client_password", "@" + file("password", "planted-password")},
                  R"({"configuration":{"server_host":"other"}})");
    EXPECT_EQ(set.status, 7) << set.output;
    EXPECT_THAT(set.output, HasSubstr("a stored secret cannot be compared; nothing was written"));
}

}  // namespace
}  // namespace adminhost::test
