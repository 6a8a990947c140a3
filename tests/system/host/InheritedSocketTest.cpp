// The socket that the service manager creates and passes to the daemon.

#include "tests/support/TemporaryRoot.h"
#include "tests/system/host/Host.h"

#include <csignal>
#include <cstdlib>
#include <fstream>
#include <iterator>

#include <fcntl.h>
#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

using testing::HasSubstr;

class InheritedSocket : public ::testing::Test {
  protected:
    InheritedSocket() {
        _root.write("/etc/passwd", "root:x:0:0::/root:/bin/sh\n");
        _root.write("/etc/group", "root:x:0:\n");
    }

    [[nodiscard]] std::string path() const { return _root.path("/socket"); }
    /// A socket as the service manager creates it: bound, blocking, and inherited by children.
    [[nodiscard]] int bound(int type = SOCK_STREAM) const {
        const int listener = ::socket(AF_UNIX, type, 0);
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path().copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(::bind(listener, reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
        return listener;
    }
    [[nodiscard]] int listening() const {
        const int listener = bound();
        EXPECT_EQ(::listen(listener, 16), 0);
        return listener;
    }
    /// Starts the daemon with the descriptor as its first inherited one.
    pid_t start(int listener, const std::string& configuration = "", const std::string& count = "1",
                const std::string& socket = {}) const {
        _root.write("/adminhostd.toml", configuration);
        const pid_t pid = ::fork();
        if (pid == 0) {
            constexpr int first = 3;
            const int error = ::open(_root.path("/error").c_str(), O_WRONLY | O_CREAT | O_TRUNC, 0600);
            ::dup2(error, STDERR_FILENO);
            ::dup2(listener, first);
            ::close_range(first + 1, ~0U, 0);
            ::setenv("LISTEN_PID", std::to_string(::getpid()).c_str(), 1);
            ::setenv("LISTEN_FDS", count.c_str(), 1);
            const std::string program = std::string(BINARY_DIR) + "/bin/adminhostd";
            const std::string root = _root.path("/");
            const std::string place = socket.empty() ? path() : socket;
            const std::string file = _root.path("/adminhostd.toml");
            const std::string plugin = pluginFile("fixture_good");
            ::execl(program.c_str(), program.c_str(), "--root", root.c_str(), "--socket", place.c_str(), "--config",
                    file.c_str(), "--plugin", plugin.c_str(), "--log", "stderr", nullptr);
            ::_exit(127);
        }
        return pid;
    }
    static int end(pid_t pid) {
        int status = -1;
        EXPECT_EQ(::waitpid(pid, &status, 0), pid);
        return WIFEXITED(status) ? WEXITSTATUS(status) : 128;
    }
    [[nodiscard]] std::string error() const { return _root.read("/error"); }

    const TemporaryRoot _root;
};

TEST_F(InheritedSocket, IsServedAndStaysWhenTheDaemonEnds) {
    const int listener = listening();
    UnixHttp early(path());  // before the daemon runs
    early.begin("GET", "/v1/");
    const pid_t pid = start(listener);
    EXPECT_EQ(early.reply().status, 200) << error();
    const HttpReply listing = UnixHttp(path()).post(
        "/v1/fixture/run",
        R"({"script": "env | grep -c LISTEN_ || for fd in /proc/self/fd/*; do readlink $fd; done"})");
    EXPECT_THAT(listing.body, testing::AllOf(HasSubstr(R"("output":"0\n)"), testing::Not(HasSubstr("socket:"))))
        << "no tool gets it";
    ::kill(pid, SIGTERM);
    EXPECT_EQ(end(pid), 0);
    struct stat status {};
    EXPECT_EQ(::lstat(path().c_str(), &status), 0) << "it is the service manager's";

    // The service manager keeps it open: a client that connects meanwhile is served by the next daemon.
    UnixHttp waiting(path());
    waiting.begin("GET", "/v1/");
    const pid_t next = start(listener);
    EXPECT_EQ(waiting.reply().status, 200);
    ::kill(next, SIGTERM);
    EXPECT_EQ(end(next), 0);
    ::close(listener);
}

TEST_F(InheritedSocket, WithASocketGroupInTheConfigurationIsAnError) {
    const int listener = listening();
    EXPECT_EQ(end(start(listener, "socket_group = \"root\"\n")), 1);
    EXPECT_THAT(error(), HasSubstr("set SocketGroup= in adminhostd.socket and remove socket_group"));
    ::close(listener);
}

TEST_F(InheritedSocket, AtAnotherPathThanTheDaemonsIsAnError) {
    const int listener = listening();
    EXPECT_EQ(end(start(listener, "", "1", path() + ".other")), 1);
    EXPECT_THAT(error(), HasSubstr("must name the same path"));
    ::close(listener);
}

TEST_F(InheritedSocket, ThatDoesNotListenOrIsNotOneIsAnError) {
    const int unheard = bound(SOCK_DGRAM);
    EXPECT_EQ(end(start(unheard)), 1);
    EXPECT_THAT(error(), HasSubstr("something else than a listening Unix stream socket"));
    const int file = ::open("/dev/null", O_RDONLY);
    EXPECT_EQ(end(start(file)), 1);
    EXPECT_THAT(error(), HasSubstr("something else than a listening Unix stream socket"));
    EXPECT_EQ(end(start(file, "", "2")), 1);
    EXPECT_THAT(error(), HasSubstr("passes 2 sockets; name one in adminhostd.socket"));
    ::close(unheard);
    ::close(file);
}

}  // namespace
}  // namespace adminhost::test
