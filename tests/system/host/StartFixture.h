#pragma once

// Starts the daemon's program by itself, in a directory of the test.

#include "tests/support/Program.h"
#include "tests/system/host/Host.h"

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

namespace adminhost::test {

namespace fs = std::filesystem;

class Start : public ::testing::Test {
  protected:
    Start() {
        std::string path = (fs::temp_directory_path() / "start.XXXXXX").string();
        EXPECT_NE(::mkdtemp(path.data()), nullptr);
        directory = path;
    }
    ~Start() override { fs::remove_all(directory); }
    Start(const Start&) = delete;
    Start& operator=(const Start&) = delete;

    ProgramResult run(std::vector<std::string> arguments) const {
        arguments.insert(arguments.begin(), std::string(BINARY_DIR) + "/bin/adminhostd");
        return runProgram(arguments, Errors::merge);
    }
    std::string configuration(const std::string& text) const {
        const fs::path file = directory / "adminhostd.toml";
        std::ofstream(file) << text;
        return file;
    }

    fs::path directory;
};

}  // namespace adminhost::test
