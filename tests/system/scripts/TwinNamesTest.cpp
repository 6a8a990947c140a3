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

class TwinNames : public testing::Test {
  protected:
    TwinNames() {
        std::string pattern = (fs::temp_directory_path() / "twins-XXXXXX").string();
        _tree = ::mkdtemp(pattern.data());
    }
    ~TwinNames() override { fs::remove_all(_tree); }

    void write(const std::string& file, const std::string& text) const {
        fs::create_directories((_tree / file).parent_path());
        std::ofstream(_tree / file) << text;
    }
    [[nodiscard]] static ProgramResult check(const std::string& root) {
        return runProgram({"/usr/bin/python3", "-B", SOURCE_DIR "/scripts/twin_names.py", root}, Errors::merge);
    }

    fs::path _tree;
};

TEST_F(TwinNames, NoProgramHasTwoTypesOrFilesOfOneName) {
    const ProgramResult result = check(SOURCE_DIR);
    EXPECT_EQ(result.status, 0) << result.output;
}

TEST_F(TwinNames, TypesAndFilesOfOneNameInOneProgramAreNamed) {
    write("platform/value/Tray.h", "struct ADMINHOST_EXPORT Tray final : Base {\n};\n");
    write("resources/Shelf.cpp", "enum class Tray : unsigned char {\n};\n");
    write("settings/Shelf.cpp", "");
    const ProgramResult result = check(_tree);
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.output,
              "platform/value/Tray.h, resources/Shelf.cpp: types of the same name Tray\n"
              "resources/Shelf.cpp, settings/Shelf.cpp: files of the same name Shelf.cpp\n");
}

TEST_F(TwinNames, DeclarationsInnerTypesAndOtherProgramsDoNotCount) {
    write("platform/value/Tray.h", "struct Tray {\n    enum class State { full };\n};\nclass Shelf;\n");
    write("platform/value/Tray.cpp", "struct Tray::Inner {\n};\nstruct Crate {\n    struct State {\n    };\n};\n");
    write("adminhostd/Shelf.h", "class Shelf {\n};\n");
    write("adminhostctl/Shelf.h", "class Shelf {\n};\n");
    const ProgramResult result = check(_tree);
    EXPECT_EQ(result.status, 0) << result.output;
}

}  // namespace
