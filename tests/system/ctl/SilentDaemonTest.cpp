// A daemon that accepts connections and never answers.

#include "tests/support/Program.h"

#include <chrono>
#include <cstdlib>
#include <filesystem>
#include <string>
#include <vector>

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

using testing::HasSubstr;

class SilentDaemon : public testing::Test {
  protected:
    SilentDaemon() {
        std::string pattern = (std::filesystem::temp_directory_path() / "silent.XXXXXX").string();
        _directory = ::mkdtemp(pattern.data());
        _listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        socket().copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(::bind(_listener, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        EXPECT_EQ(::listen(_listener, 8), 0);
    }
    ~SilentDaemon() override {
        ::close(_listener);
        std::filesystem::remove_all(_directory);
    }
    [[nodiscard]] std::string socket() const { return _directory + "/socket"; }
    [[nodiscard]] ProgramResult ctl(std::vector<std::string> words) const {
        words.insert(words.begin(), {std::string(BINARY_DIR) + "/bin/adminhostctl", "--socket", socket()});
        return runProgram(words, Errors::merge);
    }

  private:
    std::string _directory;
    int _listener = -1;
};

TEST_F(SilentDaemon, EndsEveryVerbAfterItsTimeout) {
    for (const std::vector<std::string>& words : {std::vector<std::string>{"settings", "get"},
                                                  {"camera", "list"},
                                                  {"settings", "set", "server_port", "1"},
                                                  {"writeSettings", "configuration.server_port=1"},
                                                  {"history"},
                                                  {"whois", "anna"},
                                                  {"cancel", "X"}}) {
        std::vector<std::string> all{"--timeout", "0.3"};
        all.insert(all.end(), words.begin(), words.end());
        const ProgramResult result = ctl(all);
        EXPECT_EQ(result.status, 3) << words[0] << result.output;
        EXPECT_THAT(result.output, HasSubstr("the daemon has not answered within 0.3 s"));
    }
}

TEST_F(SilentDaemon, TimeoutThatIsNotANumberOfSecondsIsAUsageError) {
    for (const char* const text : {"0", "x", "1s", "", "1e9", "nan"}) {
        const ProgramResult result = ctl({"--timeout", text, "daemon"});
        EXPECT_EQ(result.status, 2) << text;
        EXPECT_THAT(result.output, HasSubstr("--timeout")) << text;
    }
}

}  // namespace
}  // namespace adminhost::test
