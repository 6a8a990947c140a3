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

class MessageMembers : public testing::Test {
  protected:
    MessageMembers() {
        std::string pattern = (fs::temp_directory_path() / "members-XXXXXX").string();
        _tree = ::mkdtemp(pattern.data());
        write("adminhostd/MessageMembers.h",
              "std::tuple(member(\"log.event\", &Log::event),\n           member(\n\"begun.user\", &Begun::user));\n");
    }
    ~MessageMembers() override { fs::remove_all(_tree); }

    void write(const std::string& file, const std::string& text) const {
        fs::create_directories((_tree / file).parent_path());
        std::ofstream(_tree / file) << text;
    }
    [[nodiscard]] static ProgramResult check(const std::string& root) {
        return runProgram({"/usr/bin/python3", "-B", SOURCE_DIR "/scripts/message_members.py", root}, Errors::merge);
    }

    fs::path _tree;
};

TEST_F(MessageMembers, AreNamedInOneHeader) {
    const ProgramResult result = check(SOURCE_DIR);
    EXPECT_EQ(result.status, 0) << result.output;
}

TEST_F(MessageMembers, NameInAnotherSourceIsFoundWithFileAndLine) {
    write("adminhostd/Front.cpp", "\nfind(\"log.event\");\n");
    write("tests/unit/adminhostd/FrontTest.cpp", "find(\"begun.user\");\n");
    const ProgramResult result = check(_tree);
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.output,
              "adminhostd/Front.cpp:2: names the member \"log.event\" of a message, which only "
              "adminhostd/MessageMembers.h may\n"
              "tests/unit/adminhostd/FrontTest.cpp:1: names the member \"begun.user\" of a message, which only "
              "adminhostd/MessageMembers.h may\n");
}

TEST_F(MessageMembers, PartOfALiteralAndOtherFilesDoNotCount) {
    write("adminhostd/Front.cpp", "say(\"the log.event is\", log.event);\n");
    write("docs/log.md", "\"log.event\"\n");
    const ProgramResult result = check(_tree);
    EXPECT_EQ(result.status, 0) << result.output;
}

TEST_F(MessageMembers, HeaderWithoutNamesIsAFailureOfTheSearch) {
    write("adminhostd/MessageMembers.h", "");
    const ProgramResult result = check(_tree);
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.output, "adminhostd/MessageMembers.h: no names of members were found\n");
}

}  // namespace
