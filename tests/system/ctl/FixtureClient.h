#pragma once

// The command line of this build with the daemon of this build and the fixture plug-in.

#include "tests/support/DaemonProcess.h"
#include "tests/support/Program.h"

#include <filesystem>
#include <fstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::test {

class FixtureClient : public testing::Test {
  protected:
    [[nodiscard]] std::vector<std::string> command(std::vector<std::string> words) const {
        words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon.socket()});
        return words;
    }
    /// Output and messages together.
    [[nodiscard]] ProgramResult ctl(std::vector<std::string> words) const {
        return runProgram(command(std::move(words)), Errors::merge);
    }
    /// A place below the daemon's system root.
    [[nodiscard]] std::filesystem::path disk(const std::string& hostPath) const {
        return daemon.directory().string() + "/root" + hostPath;
    }
    static void append(const std::filesystem::path& file, const std::string& text) {
        std::ofstream(file, std::ios::app) << text;
    }

    const DaemonProcess daemon{
        {{"--plugin", std::string(BINARY_DIR) + "/tests/plugins/fixture_good.so"}, "", {}, true, {}, 0, -1}};
};

}  // namespace adminhost::test
