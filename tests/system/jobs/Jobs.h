#pragma once

// A host with 1,000 cameras, and the command line as a script or a cron job starts it: with an empty environment and
// absolute paths. The state is read back with the SQL tool and from the service's files, never with the command line.

#include "tests/support/DaemonProcess.h"
#include "tests/support/Program.h"
#include "tests/support/SampleRoot.h"

#include <memory>
#include <set>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

namespace adminhost::test {

constexpr const char* ctlProgram = BINARY_DIR "/bin/adminhostctl";

/// What a program has printed and returned.
struct Ran {
    int status = 0;
    std::string out;
    std::string err;
};

/// Runs a program with an empty environment and without a terminal.
[[nodiscard]] Ran runBare(const std::vector<std::string>& command);

[[nodiscard]] std::vector<std::string> linesOf(const std::string& text);
[[nodiscard]] std::string contentOf(const std::string& path);
/// A value of a property list, as Python prints it.
[[nodiscard]] std::string valueIn(const std::string& propertyList, const std::string& key);
/// The plain text of a protected value of the sample service.
[[nodiscard]] std::string decipheredText(const std::string& value);

/// One root and one daemon for all tests of the suite; each test uses cameras and settings of its own.
class Jobs : public testing::Test {
  protected:
    static void SetUpTestSuite();
    static void TearDownTestSuite();

    /// adminhostctl with these arguments.
    [[nodiscard]] static Ran ctl(std::vector<std::string> words);
    /// The history of this key, so wide that nothing is wrapped: names of accounts have different lengths.
    [[nodiscard]] static Ran history(const std::string& key, const std::string& since);
    /// A shell script in which $CTL is adminhostctl with the daemon's socket.
    [[nodiscard]] static Ran script(const std::string& text);
    /// Writes a file that only this account can read, and returns its path.
    [[nodiscard]] static std::string file(const std::string& name, const std::string& content);
    /// The lines that the SQL tool prints.
    [[nodiscard]] static std::vector<std::string> sql(const std::string& statement);
    /// Names of the cameras whose lists have one of the UUIDs.
    [[nodiscard]] static std::set<std::string> camerasListing(const std::vector<std::string>& uuids);

    static std::unique_ptr<SampleRoot> root;
    static std::unique_ptr<DaemonProcess> daemon;
};

}  // namespace adminhost::test
