// The command line with the daemon of this build: with the service's plug-in on a sample root, and with a plug-in that
// returns the answers that a test chooses.

#include "platform/json/Json.h"
#include "platform/release/Release.h"
#include "platform/task/Task.h"
#include "tests/support/DaemonProcess.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"

#include <filesystem>
#include <fstream>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <unistd.h>

namespace {

using adminhost::Array;
using adminhost::Dictionary;
using adminhost::Value;
using adminhost::test::DaemonProcess;
using testing::AllOf;
using testing::HasSubstr;
using testing::Not;

const std::string program = std::string(BINARY_DIR) + "/bin/adminhostctl";

struct Result {
    int status = 0;
    std::string out;
    std::string err;

    [[nodiscard]] Value value() const { return adminhost::parseJson(out).value_or(Value()); }
};

Result runIn(const std::string& tool, const std::vector<std::string>& words, const std::string& socket,
             const std::optional<std::string>& input = {}) {
    Result result;
    result.status = adminhost::launch_task_with_input_and_environment(
        adminhost::DiskPath(tool), words, input, &result.out, &result.err,
        {{"ADMINHOST_SOCKET", socket}, {"COLUMNS", "100"}, {"TZ", "Europe/Berlin"}});
    return result;
}

DaemonProcess::Options withPlugins(const std::vector<std::string>& files, const std::vector<std::string>& others = {}) {
    DaemonProcess::Options options;
    for (const std::string& file : files) {
        options.arguments.insert(options.arguments.end(), {"--plugin", std::string(BINARY_DIR) + '/' + file});
    }
    options.arguments.insert(options.arguments.end(), others.begin(), others.end());
    return options;
}

/// One daemon with the described plug-in for all tests of a suite.
class Ctl : public testing::Test {
  protected:
    static void SetUpTestSuite() {
        daemon = std::make_unique<DaemonProcess>(withPlugins({"tests/plugins/fixture_described.so"}));
    }
    static void TearDownTestSuite() { daemon.reset(); }

    static Result run(const std::vector<std::string>& words, const std::optional<std::string>& input = {}) {
        return runIn(program, words, daemon->socket(), input);
    }

    static std::unique_ptr<DaemonProcess> daemon;
};
std::unique_ptr<DaemonProcess> Ctl::daemon;

TEST_F(Ctl, TextsArriveAsTheTypesThatTheDaemonDescribes) {
    const Result result = run({"--format", "json", "echoTyped", "count=7", "on=yes", "when=2026-01-31 09:00", "name=7",
                               "list.0.name=a", "list.1.name=b"});
    EXPECT_EQ(result.status, 0) << result.err;
    EXPECT_EQ(result.value(), Value(Dictionary{{"count", 7},
                                               {"on", true},
                                               {"when", adminhost::Date(std::chrono::seconds(1769846400))},
                                               {"name", "7"},
                                               {"list", Array{Dictionary{{"name", "a"}}, Dictionary{{"name", "b"}}}}}));
}

TEST_F(Ctl, OptionsMayFollowTheCommand) {
    EXPECT_EQ(run({"echoTyped", "count=7", "--format", "json"}).value(), Value(Dictionary{{"count", 7}}));
}

TEST_F(Ctl, ATextThatDoesNotFitIsUsage) {
    const Result result = run({"echoTyped", "count=seven"});
    EXPECT_EQ(result.status, 2);
    EXPECT_EQ(result.out, "");
    EXPECT_EQ(result.err, "adminhostctl: count: \"seven\" is not a whole number\n");
}

TEST_F(Ctl, ASecretComesFromStandardInputButNotFromTheCommandLine) {
    EXPECT_EQ(run({"--format", "json", "echoTyped", "password@-"}, "hunter2\n").value(),
              Value(Dictionary{{"password", "hunter2"}}));
    const Result result = run({"echoTyped", "password=hunter2"});
    EXPECT_EQ(result.status, 2);
    EXPECT_THAT(result.err,
                AllOf(HasSubstr("password: a secret is not accepted on the command line"), Not(HasSubstr("hunter2"))));
}

TEST_F(Ctl, AWholeRequestComesFromAFileOrStandardInput) {
    const std::string file = (daemon->directory() / "request").string();
    std::ofstream(file) << R"({"count": 1, "name": "file"})";
    EXPECT_EQ(run({"--format", "json", "echoTyped", "count=2", "--file", file}).value(),
              Value(Dictionary{{"count", 2}, {"name", "file"}}));
    EXPECT_EQ(run({"--format", "json", "echoTyped", "--file", "-"}, R"({"count": 3})").value(),
              Value(Dictionary{{"count", 3}}));
    const Result twice = run({"echoTyped", "--file", "-", "password@-"}, "{}");
    EXPECT_EQ(twice.status, 2);
    EXPECT_THAT(twice.err, HasSubstr("only once"));
}

TEST_F(Ctl, ABrokenFileIsUsageWithLineAndColumn) {
    const Result result = run({"echoTyped", "--file", "-"}, "{\n  \"a\" 1}");
    EXPECT_EQ(result.status, 2);
    EXPECT_THAT(result.err, HasSubstr("line 2, column "));
}

TEST_F(Ctl, DataComesFromAFileAndIsAnsweredInEachFormat) {
    EXPECT_EQ(run({"--format", "json", "echoTyped", "blob@-"}, std::string("\0\xFF", 2)).value(),
              Value(Dictionary{{"blob", adminhost::Data{0, 0xFF}}}));
    EXPECT_EQ(run({"echoTyped", "blob@-"}, "ab").out, "blob  2 bytes of data\n");
    EXPECT_THAT(run({"--format", "plist", "echoTyped", "blob@-"}, "ab").out,
                AllOf(HasSubstr("<plist version=\"1.0\">"), HasSubstr("<key>blob</key>"), HasSubstr("YWI=")));
}

TEST_F(Ctl, SizesAndDatesAreWrittenAsPeopleWriteThem) {
    const Result result = run({"measure"});
    EXPECT_EQ(result.status, 0);
    EXPECT_EQ(result.out, "room   1.2 TB\nsince  31 Jan 2026, 09:00\n");
}

TEST_F(Ctl, ARefusedRequestListsEveryFinding) {
    const Result result = run({"echoTyped", "name=bad"});
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.out, "");
    EXPECT_THAT(result.err, AllOf(HasSubstr("\n  name: is bad (choose a good one)\n"),
                                  HasSubstr("\n  name: is \\x1b[31mred (choose another)\n")));
}

TEST_F(Ctl, AnAnswerThatHoldsAnErrorIsWrittenAndIsStatusOne) {
    const Result result = run({"fail", "status=5"});
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.out, "readStatus  5\nproblem     no room\n");
    EXPECT_EQ(result.err, "adminhostctl: the service returned an error: readStatus is 5, problem is no room\n");
}

TEST_F(Ctl, AFailureInsideTheServiceShowsTheLogLinesOfItsRequest) {
    const Result result = run({"breakDown"});
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.err,
              "adminhostctl: It broke down. (BROKEN)\n"
              "log lines of the request:\n"
              "  the first step failed\n"
              "  and so did the second\n");
}

TEST_F(Ctl, AnAnswerOfNothingIsDone) {
    EXPECT_EQ(run({"nothing"}).out, "done\n");
    EXPECT_EQ(run({"nothing"}).status, 0);
    EXPECT_EQ(run({"--format", "json", "nothing"}).out, "");
}

TEST_F(Ctl, NothingReachesTheTerminalThatItWouldActOn) {
    const std::string acting = "\x1b[31m\xC2\x9B\xE2\x80\xAE";
    for (const std::vector<std::string>& words : {std::vector<std::string>{acting},
                                                  {"help", acting},
                                                  {"echoTyped", acting},
                                                  {"echoTyped", "count=" + acting},
                                                  {"echoTyped", acting + "=1"},
                                                  {"echoTyped", "name@" + acting},
                                                  {"--" + acting},
                                                  {"--format", acting},
                                                  {"camera", acting},
                                                  {"whois", acting},
                                                  {"echoTyped", "--file", acting},
                                                  {"rollback", acting}}) {
        const Result result = run(words);
        EXPECT_EQ(result.status, 2) << testing::PrintToString(words);
        EXPECT_FALSE(result.err.empty());
        for (const char* raw : {"\x1b", "\xC2\x9B", "\xE2\x80\xAE"}) {
            EXPECT_THAT(result.err + result.out, Not(HasSubstr(raw))) << testing::PrintToString(words);
        }
    }
    EXPECT_EQ(run({"--format", "json", "echoTyped", "name=" + acting}).out,
              "{\n  \"name\": \"\\u001b[31m\\u009b\\u202e\"\n}\n");
    EXPECT_THAT(run({"--format", "plist", "echoTyped", "name=\xC2\x9B\xE2\x80\xAE"}).out,
                HasSubstr("<string>&#x9b;&#x202e;</string>"));
}

TEST_F(Ctl, AnUnknownCommandIsUsageAndTheKnownOnesAreListed) {
    const Result result = run({"ecoTyped"});
    EXPECT_EQ(result.status, 2);
    EXPECT_THAT(result.err, HasSubstr("command not found: ecoTyped; did you mean \"echoTyped\"?; the commands are "
                                      "echoTyped, measure, "));
    EXPECT_THAT(run({"whoiss", "anna"}).err, HasSubstr("command not found: whoiss; did you mean \"whois\"?"));
}

TEST_F(Ctl, CommandsAndHelpComeFromTheDaemon) {
    EXPECT_EQ(run({"commands", "--names"}).out,
              "echoTyped\nmeasure\nfail\nbreakDown\nnothing\ntranslate\ngetCameras\n");
    EXPECT_THAT(run({"commands"}).out, HasSubstr("echoTyped   described  Serves echoTyped.\n"));
    EXPECT_THAT(run({"help", "echoTyped"}).out,
                AllOf(HasSubstr("echoTyped: Serves echoTyped."), HasSubstr("\n  count (whole number)\n      A key.\n"),
                      HasSubstr("Secret: password@FILE or password@-.")));
    EXPECT_EQ(run({"help", "fail", "--names"}).out, "status=\n");
}

TEST_F(Ctl, LanguagesOfTheEnvironmentOrOfTheOptionAreSentWhereTheDescriptionHasThem) {
    const auto wanted = [](const std::vector<std::string>& environment, std::vector<std::string> words) {
        std::vector<std::string> all = {"-u", "LANGUAGE", "-u", "LC_ALL", "-u", "LC_MESSAGES", "-u", "LANG"};
        all.insert(all.end(), environment.begin(), environment.end());
        words.insert(words.begin(), {program, "--format", "json"});
        all.insert(all.end(), words.begin(), words.end());
        const Result result = runIn("/usr/bin/env", all, daemon->socket());
        EXPECT_EQ(result.status, 0) << result.err;
        return result.value();
    };
    const auto languages = [](Array list) {
        return Value(Dictionary{{"options", Dictionary{{"wanted", std::move(list)}}}});
    };
    EXPECT_EQ(wanted({"LANGUAGE=fr:de", "LANG=en_GB.UTF-8"}, {"translate"}), languages({"fr", "de"}));
    EXPECT_EQ(wanted({"LANG=ja_JP.UTF-8"}, {"translate"}), languages({"ja_JP"}));
    EXPECT_EQ(wanted({"LANG=ja_JP.UTF-8"}, {"translate", "--languages", "it,en"}), languages({"it", "en"}));
    EXPECT_EQ(wanted({"LANG=ja_JP.UTF-8"}, {"translate", "--languages", ""}), languages({}));
    EXPECT_EQ(wanted({"LANG=ja_JP.UTF-8"}, {"translate", R"(options.wanted:=["de"])"}), languages({"de"}));
    EXPECT_EQ(wanted({"LC_ALL=C", "LANGUAGE=fr"}, {"translate"}), languages({}));
    EXPECT_EQ(wanted({}, {"translate"}), Value(Dictionary()));
    EXPECT_EQ(wanted({"LANG=ja_JP.UTF-8"}, {"echoTyped"}), Value(Dictionary()));
}

TEST_F(Ctl, DaemonListsPlugInsAndWaitingRequests) {
    EXPECT_THAT(run({"daemon"}).out,
                AllOf(HasSubstr("waiting"), HasSubstr("plugins (1)\n"), HasSubstr("described  1.0.0")));
}

TEST_F(Ctl, WrongNumbersOfArgumentsAreUsage) {
    EXPECT_THAT(run({}).err, HasSubstr("adminhostctl help lists"));
    for (const std::vector<std::string>& words : {std::vector<std::string>{},
                                                  {"camera"},
                                                  {"camera", "show"},
                                                  {"status", "now"},
                                                  {"--format", "xml", "status"},
                                                  {"--colour"}}) {
        EXPECT_EQ(run(words).status, 2) << testing::PrintToString(words);
    }
}

TEST(CtlReach, NoDaemonIsStatusThree) {
    const Result result = runIn(program, {"daemon"}, "/nowhere/socket");
    EXPECT_EQ(result.status, 3);
    EXPECT_THAT(result.err, HasSubstr("cannot be reached at /nowhere/socket: No such file or directory"));
}

TEST(CtlReach, VersionAndOptionsNeedNoDaemon) {
    EXPECT_EQ(runIn(program, {"--version"}, "/nowhere/socket").out, "adminhostctl " ADMINHOST_RELEASE "\n");
    const Result options = runIn(program, {"--help"}, "/nowhere/socket");
    EXPECT_EQ(options.status, 0);
    EXPECT_EQ(runIn(program, {"help"}, "/nowhere/socket").out, options.out);
    for (const char* option :
         {"--socket PATH", "--format FORMAT", "--languages LIST", "--timeout SECONDS", "-h, --help", "--version",
          "adminhostctl [OPTION]... VERB [ARGUMENT]...", "\n  camera show NAME|UUID  "}) {
        EXPECT_THAT(options.out, HasSubstr(option));
    }
    EXPECT_THAT(options.out, Not(HasSubstr("--revoke"))) << "options of a verb are in the help of the verb";
}

TEST(CtlReach, OptionThatIsWrongIsNamedAndASimilarOneSuggested) {
    for (const auto& [words, message] : std::vector<std::pair<std::vector<std::string>, std::string>>{
             {{"apply", "x", "--dry-rn"}, "adminhostctl: option not found: --dry-rn; did you mean \"--dry-run\"?\n"},
             {{"settings", "set", "a", "-x"},
              "adminhostctl: option not found: -x; a word that begins with a hyphen and is no option follows \"--\"\n"},
             {{"status", "--format", "xml"}, "adminhostctl: --format: \"xml\" is none of text, json, plist\n"},
             {{"history", "--since"}, "adminhostctl: --since needs TIME\n"},
             {{"status", "--socket", "a", "--socket", "b"}, "adminhostctl: --socket was given twice\n"},
             {{"property", "set", "a", "--protect", "--no-protect"},
              "adminhostctl: --protect and --no-protect do not go together\n"},
             {{"settings", "set", "a", "b", "c"},
              "adminhostctl: settings set: too many arguments: c; usage: adminhostctl settings set KEY "},
             {{"rollback"}, "adminhostctl: rollback: an argument is missing; usage: adminhostctl rollback NUMBER "},
             {{"access"}, "adminhostctl: access: a name is missing; usage: adminhostctl access NAME|UUID "}}) {
        const Result result = runIn(program, words, "/nowhere/socket");
        EXPECT_EQ(result.status, 2) << testing::PrintToString(words);
        EXPECT_EQ(result.err.substr(0, message.size()), message);
        EXPECT_EQ(result.out, "");
    }
}

TEST(CtlReach, AnswerThatCannotBeWrittenIsSaid) {
    const adminhost::test::ProgramResult result = adminhost::test::runProgram(
        {"/bin/sh", "-c", std::string(program) + " help >/dev/full"}, adminhost::test::Errors::merge);
    EXPECT_EQ(result.status, 2);
    EXPECT_EQ(result.output, "adminhostctl: standard output cannot be written\n");
}

TEST(CtlReach, HelpOfTheVerbsNeedsNoDaemon) {
    const Result result = runIn(program, {"help"}, "/nowhere/socket");
    EXPECT_EQ(result.status, 0);
    EXPECT_THAT(result.out, HasSubstr("camera show"));
}

TEST(CtlReach, WhoMayNotUseTheDaemonGetsStatusFour) {
    const DaemonProcess daemon(withPlugins({"tests/plugins/fixture_described.so"}));
    if (::geteuid() == 0) {
        // Let another account reach the socket, so that the daemon refuses it. The program runs inside the
        // directory, from a copy: the directories above that one and above the build may be closed to others.
        std::filesystem::copy_file(program, daemon.directory() / "adminhostctl");
        const std::vector<std::string> words = {"-C",
                                                daemon.directory(),
                                                "setpriv",
                                                "--reuid=65534",
                                                "--regid=65534",
                                                "--clear-groups",
                                                "./adminhostctl",
                                                "daemon"};
        std::filesystem::permissions(daemon.directory(), std::filesystem::perms(0755));
        std::filesystem::permissions(daemon.socket(), std::filesystem::perms(0666));
        const Result refused = runIn("/usr/bin/env", words, "socket");
        EXPECT_EQ(refused.status, 4) << refused.err;
        EXPECT_THAT(refused.err, HasSubstr("NOT_PERMITTED"));
        std::filesystem::permissions(daemon.socket(), std::filesystem::perms(0600));
        EXPECT_EQ(runIn("/usr/bin/env", words, "socket").status, 4);
    } else {
        std::filesystem::permissions(daemon.socket(), std::filesystem::perms(0000));
        const Result closed = runIn(program, {"daemon"}, daemon.socket());
        EXPECT_EQ(closed.status, 4) << closed.err;
    }
}

TEST(CtlPlugins, ACommandOfTwoPlugInsNeedsThePlugInsName) {
    const adminhost::test::SampleRoot root;
    const DaemonProcess daemon(
        withPlugins({"tests/plugins/fixture_described.so", "lib/adminhost_lumio.so"}, {"--root", root.path()}));
    const Result both = runIn(program, {"getCameras"}, daemon.socket());
    EXPECT_EQ(both.status, 2);
    EXPECT_THAT(both.err, HasSubstr("several plug-ins have a command getCameras; use described/getCameras"));
    EXPECT_EQ(runIn(program, {"described/getCameras"}, daemon.socket()).out, "done\n");
    EXPECT_THAT(runIn(program, {"lumio/getCameras"}, daemon.socket()).out, HasSubstr("cameras ("));
}

/// The service's own plug-in on a sample root.
class CtlLumio : public testing::Test {
  protected:
    static void SetUpTestSuite() {
        root = std::make_unique<adminhost::test::SampleRoot>();
        daemon = std::make_unique<DaemonProcess>(withPlugins({"lib/adminhost_lumio.so"}, {"--root", root->path()}));
    }
    static void TearDownTestSuite() {
        daemon.reset();
        root.reset();
    }
    static Result run(const std::vector<std::string>& words) { return runIn(program, words, daemon->socket()); }

    static std::unique_ptr<adminhost::test::SampleRoot> root;
    static std::unique_ptr<DaemonProcess> daemon;
};
std::unique_ptr<adminhost::test::SampleRoot> CtlLumio::root;
std::unique_ptr<DaemonProcess> CtlLumio::daemon;

TEST_F(CtlLumio, CamerasAreListedWithTheNamesOfThePeople) {
    const Result result = run({"camera", "list"});
    EXPECT_EQ(result.status, 0) << result.err;
    EXPECT_THAT(result.out, AllOf(testing::StartsWith("NAME "), HasSubstr(" (user)"), HasSubstr(" (group)"),
                                  Not(HasSubstr("UUID"))));
}

TEST_F(CtlLumio, ACameraIsShownByNameAndByUuidInAnyCase) {
    const std::string name = root->sql("select name from cameras where disabled != 't' limit 1");
    const std::string uuid = root->sql("select lower(uuid) from cameras where disabled != 't' limit 1");
    const auto line = [](const std::string& text) { return text.substr(0, text.find('\n')); };
    const Result byName = run({"--format", "json", "camera", "show", line(name)});
    EXPECT_EQ(byName.status, 0) << byName.err;
    ASSERT_NE(byName.value().dictionary(), nullptr) << byName.out;
    EXPECT_EQ(*byName.value().dictionary()->get("name").string(), line(name));
    EXPECT_EQ(run({"--format", "json", "camera", "show", line(uuid)}).out, byName.out);
    const Result unknown = run({"camera", "show", "nobody's"});
    EXPECT_EQ(unknown.status, 2);
    EXPECT_EQ(run({"camera", "remove", "nobody's"}).err, unknown.err) << "the same mistake has the same words";
    EXPECT_EQ(run({"camera", "remove", "nobody's"}).status, 2);
}

TEST_F(CtlLumio, TheNamesForCompletionAreThoseOfTheList) {
    const Value cameras = run({"--format", "json", "camera", "list"}).value();
    std::string names;
    for (const Value& camera : *cameras.array()) {
        names += *camera.dictionary()->get("name").string() + '\n';
    }
    EXPECT_EQ(run({"camera", "list", "--names"}).out, names);
}

TEST_F(CtlLumio, AVariantNarrowsWhatIsRead) {
    const Value cameras = run({"--format", "json", "readSettings", "optionalArguments.variant=getCameras"}).value();
    EXPECT_NE(cameras.dictionary()->at("configuration.cameras").array(), nullptr);
    EXPECT_TRUE(cameras.dictionary()->at("configuration.server_port").isNull());
    EXPECT_THAT(run({"readSettings", "optionalArguments.variant=getConfig"}).out,
                AllOf(HasSubstr("  server_port "), Not(HasSubstr("cameras ("))));
}

TEST_F(CtlLumio, ANameWithADoubleQuoteIsRefusedBeforeItReachesTheDatabase) {
    const Result result =
        run({"writeSettings", "configuration.properties.0._newid_=yes", "configuration.properties.0.name=a\"b"});
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.err, HasSubstr("configuration.properties.0.name: must not hold a double quote"));
}

}  // namespace
