#include "tests/support/Program.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::test::Errors;
using adminhost::test::ProgramResult;
using adminhost::test::runProgram;
namespace fs = std::filesystem;

// A copy of the files that the script reads, with one more file.
class PluginWords : public testing::Test {
  protected:
    PluginWords() {
        std::string pattern = (fs::temp_directory_path() / "words-XXXXXX").string();
        _tree = ::mkdtemp(pattern.data());
        for (const char* const part : {"adminhostd", "adminhostctl", "platform", "plugin", "handler", "resources",
                                       "settings", "commands", "docs"}) {
            fs::copy(fs::path(SOURCE_DIR) / part, _tree / part, fs::copy_options::recursive);
        }
    }
    ~PluginWords() override { fs::remove_all(_tree); }

    [[nodiscard]] ProgramResult check() const {
        return runProgram({"/usr/bin/python3", "-B", SOURCE_DIR "/scripts/plugin_words.py", _tree}, Errors::merge);
    }
    /// The script's output for a file with this line.
    [[nodiscard]] std::string of(const std::string& file, const std::string& line) const {
        std::ofstream(_tree / file) << line << '\n';
        const ProgramResult result = check();
        fs::remove(_tree / file);
        EXPECT_EQ(result.status, result.output.empty() ? 0 : 1);
        return result.output;
    }

    fs::path _tree;
};

TEST_F(PluginWords, HostAndGenericClientNameNothingOfThePlugin) {
    const ProgramResult result = check();
    EXPECT_EQ(result.status, 0) << result.output;
}

TEST_F(PluginWords, CommandKeyColumnToolAndTableAreNamedWithFileAndLine) {
    for (const char* const word :
         {"getCameras", "server_port", "nimbo_client_password", "recording_status", "sqlite3",
          "setup_lumioserverd_preferences", "access_control_entries", "use_user_uuid", "withDetails"}) {
        EXPECT_EQ(of("adminhostd/Extra.cpp", std::string("// ") + word),
                  std::string("adminhostd/Extra.cpp:1: names \"") + word + "\", which only the plug-in knows\n");
    }
    EXPECT_THAT(of("adminhostctl/Extra.cpp", "call(\"server_port\");"),
                testing::StartsWith("adminhostctl/Extra.cpp:1: "));
    EXPECT_THAT(of("platform/json/Extra.h", "/// \"server_port\""), testing::StartsWith("platform/json/Extra.h:1: "));
}

TEST_F(PluginWords, DesiredStateKnowsNoServiceAndTheVerbsOfThisOneDo) {
    EXPECT_THAT(of("adminhostctl/desired/Extra.cpp", "call(\"server_port\");"), testing::HasSubstr("\"server_port\""));
    EXPECT_EQ(of("adminhostctl/lumio/Extra.cpp", "call(\"server_port\");"), "");
}

TEST_F(PluginWords, NameOfAListCountsWithinALiteralAndNotWithinAWord) {
    EXPECT_THAT(of("adminhostctl/Extra.cpp", "say(\"a section (cameras.users)\");"),
                testing::HasSubstr("names \"cameras\""));
    EXPECT_EQ(of("adminhostctl/Extra.cpp", "say(\"camerashop\"); // cameras"), "");
}

TEST_F(PluginWords, PlainWordsOfDictionariesCountOnlyAsWholeLiterals) {
    EXPECT_THAT(of("adminhostd/Extra.cpp", "find(\"cameras\");"), testing::HasSubstr("names \"cameras\""));
    EXPECT_THAT(of("adminhostd/Extra.cpp", "find(\"configuration\");"), testing::HasSubstr("names \"configuration\""));
    EXPECT_EQ(of("adminhostd/Extra.cpp", "// the daemon's configuration, and no cameras"), "");
    EXPECT_EQ(of("adminhostd/Extra.cpp", "say(\"the configuration cannot be read\");"), "");
}

TEST_F(PluginWords, RoomsThatKnowThePluginMayNameIt) {
    EXPECT_EQ(of("adminhostctl/lumio/Extra.cpp", "call(\"getCameras\");"), "");
    EXPECT_EQ(of("handler/Extra.cpp", "call(\"getCameras\");"), "");
}

TEST_F(PluginWords, WordOfANewDescriptionIsLookedForAtOnce) {
    std::ofstream(_tree / "commands/newOne.toml") << "[keys.brand_new]\ntype = \"text\"\n";
    EXPECT_THAT(of("adminhostd/Extra.cpp", "find(\"brand_new\"); newOne();"),
                testing::AllOf(testing::HasSubstr("\"brand_new\""), testing::HasSubstr("\"newOne\"")));
}

}  // namespace
