// What the daemon rejects before it serves, and what --check reports: configuration, command line, root.

#include "platform/release/Release.h"
#include "tests/support/TemporaryRoot.h"
#include "tests/system/host/StartFixture.h"

#include <sys/stat.h>

namespace adminhost::test {
namespace {

TEST_F(Start, CheckReportsThatNothingIsWrongAndLeavesNothingBehind) {
    const TemporaryRoot other;
    other.write("/adminhostd.toml", "account = \"nobody\"\n");
    const ProgramResult result = run({"--check", "--config", other.path("/adminhostd.toml"), "--plugin",
                                      pluginFile("fixture_good"), "--socket", directory / "socket"});
    EXPECT_EQ(result.status, 0) << result.output;
    EXPECT_EQ(result.output,
              "Nothing is wrong. Plug-ins: fixture 1.2.3. Socket: " + (directory / "socket").string() + "\n");
    EXPECT_TRUE(fs::is_empty(directory));
}

TEST_F(Start, CheckNamesEveryProblemWithASuggestedFix) {
    const std::string file = configuration("socket_group = \"no-such-group\"\n");
    const ProgramResult result = run({"--check", "--config", file, "--plugin", pluginFile("fixture_good"), "--socket",
                                      directory / "none" / "socket"});
    EXPECT_EQ(result.status, 1);
    EXPECT_NE(result.output.find("unknown group \"no-such-group\""), std::string::npos) << result.output;
    EXPECT_NE(result.output.find("create its directory, or choose another path with --socket"), std::string::npos)
        << result.output;
    const std::string accounts = configuration("account_uuids = \"" + (directory / "uuids").string() + "\"\n");
    EXPECT_NE(
        run({"--check", "--config", accounts, "--plugin", pluginFile("fixture_good"), "--socket", directory / "s"})
            .output.find("uuids: No such file or directory; create the file or correct account_uuids"),
        std::string::npos);
    configuration("socket_group = \"no-such-group\"\n");
    EXPECT_NE(run({"--check", "--config", file, "--plugin", pluginFile("fixture_no_note"), "--socket", directory / "s"})
                  .output.find("has no build note"),
              std::string::npos)
        << "one problem does not hide the others";
    std::ofstream(directory / "file") << "precious";
    EXPECT_NE(run({"--check", "--plugin", pluginFile("fixture_good"), "--socket", directory / "file"})
                  .output.find("file exists and is not a socket"),
              std::string::npos);
    const ProgramResult crashing =
        run({"--check", "--plugin", pluginFile("fixture_crashing_later"), "--socket", directory / "socket"});
    EXPECT_EQ(crashing.status, 1);
    EXPECT_NE(crashing.output.find("before it was ready"), std::string::npos) << crashing.output;
}

TEST_F(Start, MistakesInTheConfigurationAreNamedWithTheirLine) {
    struct {
        const char* text;
        const char* expected;
    } const cases[] = {
        {"queue_limit = 1\nqueu_limit = 2\n", "line 2, column 1: unknown key \"queu_limit\"; known keys: plugins"},
        {"\nqueue_limit = \"2\"\n", "line 2, column 15: \"queue_limit\" must be a whole number"},
        {"queue_limit_per_account = 0\n", "line 1, column 27: \"queue_limit_per_account\" must be a whole number"},
        {"queue_limit = -1\n", "line 1, column 15: \"queue_limit\" must be"},
        {"request_deadline_seconds = 0\n",
         "line 1, column 28: \"request_deadline_seconds\" must be a number of seconds"},
        {"request_deadline_seconds = nan\n",
         "line 1, column 28: \"request_deadline_seconds\" must be a number of seconds"},
        {"client_timeout_seconds = true\n",
         "line 1, column 26: \"client_timeout_seconds\" must be a number of seconds"},
        {"log = \"file\"\n", "line 1, column 7: \"log\" must be"},
        {"body_limit_bytes = 1023\n",
         "line 1, column 20: \"body_limit_bytes\" must be a whole number from 1024 to 67108864"},
        {"values_limit = 1.5\n", "line 1, column 16: \"values_limit\" must be a whole number from 100 to 10000000"},
        {"depth_limit = 513\n", "line 1, column 15: \"depth_limit\" must be a whole number from 1 to 512"},
        {"head_limit_bytes = \"8k\"\n",
         "line 1, column 20: \"head_limit_bytes\" must be a whole number from 1024 to 1048576"},
        {"connection_limit = 1\n", "line 1, column 20: \"connection_limit\" must be a whole number from 2 to 4096"},
        {"plugin_directory = 1\n", "line 1, column 20: \"plugin_directory\" must be a text"},
        {"socket = []\n", "line 1, column 10: \"socket\" must be a text"},
        {"socket_group = 0\n", "line 1, column 16: \"socket_group\" must be a text"},
        {"account = 65534\n", "line 1, column 11: \"account\" must be a text"},
        {"account = \"\"\n", "line 1, column 11: \"account\" must"},
        {"account_uuids = true\n", "line 1, column 17: \"account_uuids\" must be a text"},
        {"service_manager = \"launchd\"\n",
         "line 1, column 19: \"service_manager\" must be \"systemd\" or \"pidfile\""},
        {"languages = \"de\"\n", "line 1, column 13: \"languages\" must be a list of texts"},
        {"plugins = [1]\n", "line 1, column 11: \"plugins\" must be a list of texts"},
        {"socket = 1\n", "line 1, column 10: \"socket\" must be a text"},
        {"[section]\nlog = \"syslog\"\n", "line 1, column 2: unknown key \"section\""},
        {"queue_limit = = 2\n", "line 1, column"},
    };
    for (const auto& entry : cases) {
        const ProgramResult result = run({"--check", "--config", configuration(entry.text)});
        EXPECT_EQ(result.status, 1) << entry.text;
        EXPECT_NE(result.output.find(entry.expected), std::string::npos) << entry.text << result.output;
    }
    EXPECT_EQ(run({"--check", "--config", (directory / "missing").string()}).status, 1);
}

TEST_F(Start, RootThatDoesNotExistIsNeitherMadeNorServed) {
    const fs::path missing = directory / "missing";
    for (const std::vector<std::string>& arguments : {std::vector<std::string>{"--root", missing, "--check"},
                                                      {"--root", missing, "--socket", directory / "socket"}}) {
        const ProgramResult result = run(arguments);
        EXPECT_EQ(result.status, 1);
        EXPECT_NE(result.output.find("missing is not a directory; create it or correct --root"), std::string::npos)
            << result.output;
    }
    EXPECT_FALSE(fs::exists(missing));
}

TEST_F(Start, ConfigurationThatOthersMayWriteIsRefused) {
    const fs::path etc = directory / "etc";
    fs::create_directories(etc);
    std::ofstream(etc / "adminhostd.toml") << "queue_limit = 3\n";
    ASSERT_EQ(::chmod((etc / "adminhostd.toml").c_str(), 0664), 0);
    const ProgramResult ours = run({"--root", directory, "--check"});
    EXPECT_EQ(ours.status, 1);
    EXPECT_NE(ours.output.find("adminhostd.toml may be written by group or others; chmod go-w it"), std::string::npos)
        << ours.output;

    const std::string named = configuration("queue_limit = 3\n");
    ASSERT_EQ(::chmod(named.c_str(), 0646), 0);
    const ProgramResult open = run({"--root", directory / "etc", "--config", named, "--check"});
    EXPECT_EQ(open.status, 1);
    EXPECT_NE(open.output.find("may be written by everybody; chmod o-w it"), std::string::npos) << open.output;
    expectRefusedForRoot(named, {"--config", named});
}

TEST_F(Start, CheckReportsASocketPathThatIsTooLong) {
    const fs::path deep = directory / std::string(100, 'x');
    fs::create_directory(deep);
    const ProgramResult result = run({"--check", "--socket", deep / "socket", "--plugin", pluginFile("fixture_good")});
    EXPECT_EQ(result.status, 1);
    EXPECT_NE(result.output.find("must have 1 to 107 bytes; choose a shorter one"), std::string::npos) << result.output;
}

TEST_F(Start, ConfigurationThatIsADirectoryIsAnError) {
    for (const std::vector<std::string>& arguments :
         {std::vector<std::string>{"--check", "--config", directory, "--plugin", pluginFile("fixture_good")},
          {"--config", directory, "--socket", directory / "socket"}}) {
        const ProgramResult result = run(arguments);
        EXPECT_EQ(result.status, 1);
        EXPECT_NE(
            result.output.find(directory.string() + ": Is a directory; the configuration must be a readable file"),
            std::string::npos)
            << result.output;
    }
    fs::create_directories(directory / "root/etc/adminhostd.toml");
    const ProgramResult standard = run({"--root", directory / "root", "--check"});
    EXPECT_EQ(standard.status, 1);
    EXPECT_NE(standard.output.find("etc/adminhostd.toml: Is a directory"), std::string::npos) << standard.output;
}

TEST_F(Start, CommandLineMistakesAreUsageErrors) {
    EXPECT_EQ(run({"--nonsense"}).status, 2);
    EXPECT_EQ(run({"--log", "file"}).status, 2);
    EXPECT_EQ(run({"stray"}).status, 2);
    const ProgramResult help = run({"--help"});
    EXPECT_EQ(help.status, 0);
    for (const char* option : {"--root", "--plugin", "--socket", "--config", "--log", "--check"}) {
        EXPECT_NE(help.output.find(option), std::string::npos) << option;
    }
    EXPECT_EQ(run({"--version"}).output, "adminhostd " ADMINHOST_RELEASE "\n");
}

}  // namespace
}  // namespace adminhost::test
