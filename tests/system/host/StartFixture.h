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
#include <unistd.h>

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

    /// The machine's daemon, which runs as root, gives what is in the file to root: a group that can write it is
    /// refused.
    void expectRefusedForRoot(const fs::path& file, std::vector<std::string> arguments) const {
        fs::permissions(file, fs::perms(0664));
        arguments.emplace_back("--check");
        const std::string output = run(arguments).output;
        EXPECT_EQ(output.find(file.string() + " may be written by group or others; chmod go-w it") != std::string::npos,
                  ::geteuid() == 0)
            << output;
    }

    fs::path directory;
};

}  // namespace adminhost::test
