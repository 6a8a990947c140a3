#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <string>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/wait.h>

namespace {

namespace fs = std::filesystem;

struct Result {
    int status;
    std::string output;
};

// A tree of one source file with one include, and what the script says of it.
class IncludeEdges : public testing::Test {
  protected:
    IncludeEdges() {
        std::string pattern = (fs::temp_directory_path() / "edges-XXXXXX").string();
        _tree = ::mkdtemp(pattern.data());
    }
    ~IncludeEdges() override { fs::remove_all(_tree); }

    Result check(const std::string& root) {
        const std::string output = _tree + "/output.txt";
        const std::string command =
            "/usr/bin/python3 -B " SOURCE_DIR "/scripts/include_edges.py '" + root + "' >'" + output + "' 2>&1";
        const int status = std::system(command.c_str());
        std::ostringstream text;
        text << std::ifstream(output).rdbuf();
        return {WEXITSTATUS(status), text.str()};
    }

    Result checkEdge(const std::string& source, const std::string& included) {
        fs::remove_all(_tree + "/tree");
        const fs::path file = _tree + "/tree/" + source;
        fs::create_directories(file.parent_path());
        std::ofstream(file) << "#include <vector>\n#include \"" << included << "\"\n";
        return check(_tree + "/tree");
    }

    std::string _tree;
};

TEST_F(IncludeEdges, TheProjectHasOnlyThoseOfThePicture) {
    const Result result = check(SOURCE_DIR);
    EXPECT_EQ(result.status, 0) << result.output;
}

TEST_F(IncludeEdges, EachRefusedEdgeIsNamedWithFileAndLine) {
    const std::pair<const char*, const char*> edges[] = {
        {"platform/value/Value.cpp", "handler/SettingsStore.h"},
        {"codec/Base64.cpp", "krb5/Context.h"},
        {"resources/Camera.cpp", "handler/LumioRequestHandler.h"},
        {"handler/SettingsStore.cpp", "resources/Camera.h"},
        {"handler/SettingsStore.h", "handler/LumioRequestHandler.h"},
        {"adminhostd/Main.cpp", "plugin/Commands.h"},
        {"adminhostd/Main.cpp", "handler/SettingsStore.h"},
        {"adminhostctl/Main.cpp", "platform/task/Task.h"},
        {"adminhostctl/Main.cpp", "adminhostd/Frame.h"},
        {"commands/Commands.cpp", "handler/LumioRequestHandler.h"},
        {"plugin/Plugin.cpp", "tests/support/SampleRoot.h"},
        {"handler/ReadSettings.cpp", "plugin/Plugin.h"},
    };
    for (const auto& [source, included] : edges) {
        const Result result = checkEdge(source, included);
        EXPECT_EQ(result.status, 1) << source << " -> " << included;
        EXPECT_THAT(result.output, testing::StartsWith(std::string(source) + ":2: " + included + ": "));
    }
}

TEST_F(IncludeEdges, EdgesOfThePictureAreAccepted) {
    const std::pair<const char*, const char*> edges[] = {
        {"plugin/Plugin.cpp", "handler/LumioRequestHandler.h"},
        {"handler/ReadSettings.cpp", "resources/Camera.h"},
        {"resources/Camera.cpp", "handler/SettingsStore.h"},
        {"resources/ResourceRequests.cpp", "handler/LumioRequestHandler.h"},
        {"handler/SettingsStore.cpp", "platform/plist/PropertyList.h"},
        {"adminhostctl/Main.cpp", "platform/value/Value.h"},
        {"adminhostd/Main.cpp", "platform/log/Log.h"},
        {"tests/unit/x/Test.cpp", "plugin/Plugin.h"},
    };
    for (const auto& [source, included] : edges) {
        const Result result = checkEdge(source, included);
        EXPECT_EQ(result.status, 0) << source << " -> " << included << ": " << result.output;
    }
}

TEST_F(IncludeEdges, ARoomThatThePictureDoesNotHaveIsRefused) {
    const Result result = checkEdge("utilities/Everything.cpp", "platform/value/Value.h");
    EXPECT_EQ(result.status, 1);
    EXPECT_THAT(result.output, testing::HasSubstr("a room that the picture does not have"));
}

}  // namespace
