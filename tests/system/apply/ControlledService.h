#pragma once

// The sample service with this build's daemon and plug-in, used through this build's command line.

#include "tests/support/DaemonProcess.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"

#include <fstream>
#include <sstream>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::test {

class ControlledService : public testing::Test {
  protected:
    ControlledService() = default;
    explicit ControlledService(std::string configuration) : _configuration(std::move(configuration)) {}

    [[nodiscard]] DaemonProcess::Options options() const {
        DaemonProcess::Options options;
        options.configuration = _configuration;
        options.arguments = {"--root", root.path(), "--plugin", std::string(BINARY_DIR) + "/lib/adminhost_lumio.so"};
        return options;
    }
    /// This build's command line with the daemon's socket.
    [[nodiscard]] std::vector<std::string> command(std::vector<std::string> words) const {
        words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", daemon.socket()});
        return words;
    }
    /// Output and messages together.
    [[nodiscard]] ProgramResult ctl(const std::vector<std::string>& words) const {
        return runProgram(command(words), Errors::merge);
    }
    /// Writes a file for the test and returns its path.
    [[nodiscard]] std::string file(const std::string& name, const std::string& content) const {
        const std::string path = root.directory() + '/' + name;
        std::ofstream(path) << content;
        return path;
    }
    [[nodiscard]] static std::string read(const std::string& path) {
        std::ostringstream content;
        content << std::ifstream(path).rdbuf();
        return content.str();
    }
    /// From now on a write waits in its operation, when it has compared the revision and changed nothing yet.
    void holdWrite() const { root.hold(heldTool); }
    /// Waits until a write is held. That the daemon reports it as running is not enough: the worker may not have
    /// compared the revision.
    void waitForWrite() const {
        ASSERT_TRUE(root.waitForHeld(heldTool)) << "no write runs: " << daemon.connect().get("/v1/").body;
    }
    void releaseWrite() const { root.release(heldTool); }

  private:
    static constexpr const char* heldTool = "setup_library";
    const std::string _configuration;  // used while the daemon is started

  protected:
    const SampleRoot root;
    const DaemonProcess daemon{options()};
};

}  // namespace adminhost::test
