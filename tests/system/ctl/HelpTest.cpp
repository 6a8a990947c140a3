// Help, options that do not belong to a verb, and suggestions.

#include "tests/system/apply/ControlledService.h"

namespace adminhost::test {
namespace {

using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

class Help : public ControlledService {
  protected:
    /// Without a daemon.
    [[nodiscard]] static ProgramResult alone(std::vector<std::string> words) {
        words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", "/nowhere/socket"});
        return runProgram(words, Errors::merge);
    }
    void expectUsage(const std::vector<std::string>& words, const std::string& message) const {
        const ProgramResult result = ctl(words);
        EXPECT_EQ(result.status, 2) << testing::PrintToString(words);
        EXPECT_THAT(result.output, HasSubstr(message)) << testing::PrintToString(words);
    }
};

TEST_F(Help, VerbIsDescribedWithItsOptionsAndExamplesWithoutTheDaemon) {
    const ProgramResult one = alone({"help", "settings", "set"});
    EXPECT_EQ(one.status, 0);
    EXPECT_THAT(one.output, AllOf(HasSubstr("adminhostctl settings set KEY [VALUE|@FILE|@-] "),
                                  HasSubstr("\nOptions:\n"), HasSubstr("\n  --validate "), HasSubstr("\n  --clear "),
                                  HasSubstr("\nExamples:\n  adminhostctl settings set server_port 8170\n"),
                                  Not(HasSubstr("--group")), Not(HasSubstr("settings get"))));
    EXPECT_EQ(alone({"settings", "set", "--help"}).output, one.output);
    EXPECT_EQ(alone({"settings", "set", "server_port", "1", "-h"}).output, one.output);
}

TEST_F(Help, FirstWordOfSeveralVerbsDescribesAllOfThem) {
    const ProgramResult all = alone({"help", "settings"});
    EXPECT_EQ(all.status, 0);
    EXPECT_THAT(all.output,
                AllOf(HasSubstr("adminhostctl settings get [KEY]\n"), HasSubstr("\nadminhostctl settings set KEY "),
                      Not(HasSubstr("adminhostctl camera"))));
    EXPECT_EQ(alone({"settings", "--help"}).output, all.output);
}

TEST_F(Help, KeyOfACommandIsShownWithTypeAndUnit) {
    const ProgramResult help = ctl({"help", "writeSettings"});
    EXPECT_THAT(help.output, AllOf(HasSubstr("\n  configuration.tunnel_timeout_seconds (whole number, seconds)\n"),
                                   HasSubstr("\n  configuration.max_file_size_in_mb (whole number, megabytes)\n"),
                                   HasSubstr("\n  configuration.server_host (text)\n")));
    EXPECT_EQ(ctl({"writeSettings", "--help"}).output, help.output);
}

TEST_F(Help, OptionOfAnotherVerbIsAnErrorThatNamesItsVerbs) {
    expectUsage({"settings", "get", "server_port", "--group"},
                "\"settings get\" does not have the option --group; it belongs to camera allow, camera deny, ");
    expectUsage({"history", "-f"}, "\"history\" does not have the option --follow; it belongs to logs");
    expectUsage({"getCameras", "--validate"},
                "\"getCameras\" does not have the option --validate; it belongs to settings set");
    expectUsage({"camera", "list", "--file", "x"}, "it belongs to commands");
    EXPECT_EQ(ctl({"camera", "list", "--names"}).status, 0);
}

TEST_F(Help, UnknownNamesAreUsageAndASimilarOneIsSuggested) {
    expectUsage({"camera", "shw", "Roof"}, "not a verb: \"camera shw\"; did you mean \"camera show\"?");
    expectUsage({"statsu"}, "command not found: statsu; did you mean \"status\"?");
    expectUsage({"getCamera"}, "command not found: getCamera; did you mean \"getCameras\"?");
    expectUsage({"help", "getCamera"}, "did you mean \"getCameras\"?");
    expectUsage({"settings", "get", "server_prt"}, "setting not found: server_prt; did you mean \"server_port\"?");
    expectUsage({"settings", "set", "server_prt", "1"}, "server_prt; did you mean \"server_port\"?");
    expectUsage({"camera", "show", "Studio_A"}, "camera not found: Studio_A; did you mean \"Studio A\"?");
    expectUsage({"camera", "access", "Rof", "on"}, "camera not found: Rof; did you mean \"Roof\"?");
    expectUsage({"property", "remove", "watermrk"}, "property not found: watermrk; did you mean \"watermark\"?");
    expectUsage({"whois", "ana"}, "person or group not found: ana; did you mean \"anna\"?");
    expectUsage({"access", "lecturrs"}, "person or group not found: lecturrs; did you mean \"lecturers\"?");
    expectUsage({"logs", "server_lg"}, "log not found: server_lg; did you mean \"server_log\"?");
    expectUsage({"camera", "allow", "Roof"},
                "camera allow: a name is missing; usage: adminhostctl camera allow CAMERA");
    expectUsage({"readSettings", "optionalArguments.varaint=x"}, "did you mean \"optionalArguments.variant\"?");
}

}  // namespace
}  // namespace adminhost::test
