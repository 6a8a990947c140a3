#include "tests/support/Program.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace {

using adminhost::test::Errors;
using adminhost::test::ProgramResult;
using adminhost::test::runProgram;
namespace fs = std::filesystem;

// A tree of one source file with one include, and the script's output for it.
class IncludeEdges : public testing::Test {
  protected:
    IncludeEdges() {
        std::string pattern = (fs::temp_directory_path() / "edges-XXXXXX").string();
        _tree = ::mkdtemp(pattern.data());
    }
    ~IncludeEdges() override { fs::remove_all(_tree); }

    static ProgramResult check(const std::string& root) {
        return runProgram({"/usr/bin/python3", "-B", SOURCE_DIR "/scripts/include_edges.py", root}, Errors::merge);
    }

    ProgramResult checkEdge(const std::string& source, const std::string& included) {
        fs::remove_all(_tree + "/tree");
        const fs::path file = _tree + "/tree/" + source;
        fs::create_directories(file.parent_path());
        std::ofstream(file) << "#include <vector>\n#include \"" << included << "\"\n";
        return check(_tree + "/tree");
    }

    std::string _tree;
};

TEST_F(IncludeEdges, TheProjectHasOnlyThoseOfThePicture) {
    const ProgramResult result = check(SOURCE_DIR);
    EXPECT_EQ(result.status, 0) << result.output;
}

TEST_F(IncludeEdges, EachRefusedEdgeIsNamedWithFileAndLine) {
    const std::pair<const char*, const char*> edges[] = {
        {"platform/value/Value.cpp", "settings/SettingsStore.h"},
        {"codec/Base64.cpp", "krb5/Context.h"},
        {"resources/Camera.cpp", "handler/LumioRequestHandler.h"},
        {"settings/SettingsStore.cpp", "resources/Camera.h"},
        {"settings/SettingsStore.h", "handler/LumioRequestHandler.h"},
        {"adminhostd/Main.cpp", "plugin/Commands.h"},
        {"adminhostd/Main.cpp", "settings/SettingsStore.h"},
        {"adminhostctl/program/Main.cpp", "platform/task/Task.h"},
        {"adminhostctl/Verb.cpp", "adminhostctl/desired/Plan.h"},
        {"adminhostctl/Verb.cpp", "adminhostctl/lumio/LumioVerbs.h"},
        {"adminhostctl/Mains.cpp", "adminhostctl/lumio/LumioVerbs.h"},
        {"adminhostctl/desired/Plan.cpp", "adminhostctl/lumio/LumioVerbs.h"},
        {"adminhostctl/desired/Plan.cpp", "platform/task/Task.h"},
        {"adminhostctl/desired/Plan.cpp", "platform/values/Value.h"},
        {"adminhostctl/program/Main.cpp", "adminhostd/Frame.h"},
        {"commands/Commands.cpp", "handler/LumioRequestHandler.h"},
        {"plugin/Plugin.cpp", "tests/support/SampleRoot.h"},
        {"handler/ReadSettings.cpp", "plugin/Plugin.h"},
    };
    for (const auto& [source, included] : edges) {
        const ProgramResult result = checkEdge(source, included);
        EXPECT_EQ(result.status, 1) << source << " -> " << included;
        EXPECT_THAT(result.output, testing::StartsWith(std::string(source) + ":2: " + included + ": "));
    }
}

TEST_F(IncludeEdges, EdgesOfThePictureAreAccepted) {
    const std::pair<const char*, const char*> edges[] = {
        {"plugin/Plugin.cpp", "handler/LumioRequestHandler.h"},
        {"handler/ReadSettings.cpp", "resources/Camera.h"},
        {"resources/Camera.cpp", "settings/SettingsStore.h"},
        {"handler/ResourceRequests.cpp", "resources/Property.h"},
        {"settings/SettingsStore.cpp", "platform/plist/PropertyList.h"},
        {"adminhostctl/program/Main.cpp", "platform/value/Value.h"},
        {"adminhostctl/program/Main.cpp", "adminhostctl/lumio/LumioVerbs.h"},
        {"adminhostctl/lumio/LumioVerbs.cpp", "adminhostctl/desired/Plan.h"},
        {"adminhostctl/desired/Plan.cpp", "adminhostctl/Failure.h"},
        {"adminhostctl/desired/Plan.cpp", "platform/value/Value.h"},
        {"adminhostd/Main.cpp", "platform/log/Log.h"},
        {"tests/unit/x/Test.cpp", "plugin/Plugin.h"},
    };
    for (const auto& [source, included] : edges) {
        const ProgramResult result = checkEdge(source, included);
        EXPECT_EQ(result.status, 0) << source << " -> " << included << ": " << result.output;
    }
}

TEST_F(IncludeEdges, PictureThatDiffersFromTheTableIsReportedWithTheRoom) {
    std::ostringstream picture;
    picture << std::ifstream(SOURCE_DIR "/docs/architecture.md").rdbuf();
    const std::pair<const char*, const char*> changes[] = {
        {"    adminhostd -> platform\n", "    adminhostd -> {platform, codec}\n"},
        {"{plugin, handler} -> commands", "plugin -> commands"},
        {"    adminhostctl -> platform/task\n", ""},
        {"        -> {platform/value, ", "        -> {"},
    };
    const char* const rooms[] = {"adminhostd: codec\n", "handler: commands\n", "adminhostctl: platform/task\n",
                                 "adminhostctl/desired: platform/value\n"};
    fs::create_directories(_tree + "/tree/docs");
    for (std::size_t i = 0; i < std::size(changes); ++i) {
        std::string text = picture.str();
        const std::size_t at = text.find(changes[i].first);
        ASSERT_NE(at, std::string::npos) << changes[i].first;
        text.replace(at, std::string(changes[i].first).size(), changes[i].second);
        std::ofstream(_tree + "/tree/docs/architecture.md") << text;
        const ProgramResult result = check(_tree + "/tree");
        EXPECT_EQ(result.status, 1);
        EXPECT_THAT(result.output, testing::HasSubstr(rooms[i]));
    }
    std::ofstream(_tree + "/tree/docs/architecture.md") << picture.str();
    EXPECT_EQ(check(_tree + "/tree").output, "");
}

TEST_F(IncludeEdges, ARoomThatThePictureDoesNotHaveIsRefused) {
    const ProgramResult result = checkEdge("utilities/Everything.cpp", "platform/value/Value.h");
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, testing::HasSubstr("a room that the picture does not have"));
}

}  // namespace
