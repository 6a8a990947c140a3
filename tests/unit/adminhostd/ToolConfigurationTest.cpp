#include "adminhostd/ToolConfiguration.h"

#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <string>

#include <gtest/gtest.h>
#include <sys/stat.h>

namespace adminhost {
namespace {

namespace fs = std::filesystem;

std::string contentOf(const fs::path& path) {
    std::ifstream file(path);
    return {std::istreambuf_iterator<char>(file), {}};
}

TEST(ToolConfiguration, OthersCanReadTheFilesAndWriteNothingUntilAllIsRemovedWithTheObject) {
    std::optional<ToolConfiguration> tools(std::in_place, fs::temp_directory_path().string());
    const fs::path directory = tools->directory();
    const mode_t before = ::umask(077);
    ASSERT_TRUE(writeToolFiles(directory / "plugin", {{"tool/rc", "text\n"}}));
    ::umask(before);
    for (const fs::path& part : {directory, directory / "plugin", directory / "plugin/tool"}) {
        EXPECT_EQ(fs::status(part).permissions(), fs::perms(0711)) << part;
    }
    EXPECT_EQ(fs::status(directory / "plugin/tool/rc").permissions(), fs::perms(0644));
    tools.reset();
    EXPECT_FALSE(fs::exists(directory));
}

TEST(ToolConfiguration, FilesOfAnEarlierWorkerAreReplaced) {
    const ToolConfiguration tools(fs::temp_directory_path().string());
    const fs::path directory = fs::path(tools.directory()) / "plugin";
    ASSERT_TRUE(writeToolFiles(directory, {{"tool/rc", "a longer text\n"}, {"other", "x"}}));
    ASSERT_TRUE(writeToolFiles(directory, {{"tool/rc", "short\n"}}));
    EXPECT_EQ(contentOf(directory / "tool/rc"), "short\n");
    EXPECT_EQ(contentOf(directory / "other"), "x");
    EXPECT_EQ(fs::status(directory).permissions(), fs::perms(0711));
}

TEST(ToolConfiguration, PathOutsideTheDirectoryIsAnError) {
    const ToolConfiguration tools(fs::temp_directory_path().string());
    const fs::path directory = fs::path(tools.directory()) / "plugin";
    for (const char* const path : {"", "/etc/rc", "../rc", "tool/../../rc"}) {
        const auto written = writeToolFiles(directory, {{path, "text"}});
        ASSERT_FALSE(written) << path;
        EXPECT_EQ(written.error().description, std::string(path) + ": is not a path below the directory");
    }
    EXPECT_FALSE(fs::exists(fs::path(tools.directory()) / "rc"));
}

TEST(ToolConfiguration, FileThatCannotBeWrittenIsAnErrorThatNamesIt) {
    const ToolConfiguration tools(fs::temp_directory_path().string());
    const fs::path directory = fs::path(tools.directory()) / "plugin";
    fs::create_directories(directory / "rc");
    const auto written = writeToolFiles(directory, {{"rc", "text"}});
    ASSERT_FALSE(written);
    EXPECT_EQ(written.error().description, (directory / "rc").string() + ": Is a directory");
}

}  // namespace
}  // namespace adminhost
