#include "adminhostd/Login.h"
#include "adminhostd/Peer.h"
#include "platform/files/FileDescriptor.h"

#include <cerrno>
#include <csignal>
#include <fstream>
#include <string>

#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr uid_t other = 65534;
constexpr int peerProcess = 77;  ///< SO_PEERPIDFD, which the C library's headers may not have

uid_t shownFor(pid_t pid) {
    uid_t login = noLogin;
    std::ifstream("/proc/" + std::to_string(pid) + "/loginuid") >> login;
    return login;
}

/// A process in a login session of its own if the kernel allows that, as another account if this one may change to it.
class Session {
  public:
    Session() {
        int ends[2];
        EXPECT_EQ(::pipe(ends), 0);
        _pid = ::fork();
        if (_pid == 0) {
            std::ofstream("/proc/self/loginuid") << 54321;
            if (::setresuid(other, other, other) == 0) {
                ::prctl(PR_SET_DUMPABLE, 1);  // so that its files in /proc are its account's
            }
            ::close(ends[1]);
            for (;;) {
                ::pause();
            }
        }
        ::close(ends[1]);
        char unused = 0;
        EXPECT_EQ(::read(ends[0], &unused, 1), 0);  // once the process has changed
        ::close(ends[0]);
    }
    Session(const Session&) = delete;
    Session& operator=(const Session&) = delete;
    ~Session() { end(); }

    [[nodiscard]] pid_t pid() const noexcept { return _pid; }
    void end() {
        if (_pid > 0) {
            ::kill(_pid, SIGKILL);
            ::waitpid(_pid, nullptr, 0);
        }
        _pid = -1;
    }

  private:
    pid_t _pid = -1;
};

TEST(Login, IsTheSessionThatTheProcessBelongsTo) {
    EXPECT_EQ(loginOf(::getpid(), ::geteuid()), shownFor(::getpid()));
    const Session session;
    const uid_t uid = ::geteuid() == 0 ? other : ::geteuid();
    EXPECT_EQ(loginOf(session.pid(), uid), shownFor(session.pid()));
}

TEST(Login, OfAProcessThatHasEndedIsNotKnown) {
    Session session;
    const pid_t pid = session.pid();
    session.end();
    EXPECT_EQ(loginOf(pid, ::geteuid()), noLogin);
    EXPECT_EQ(loginOf(0, 0), noLogin) << "a client in another namespace has no process id here";
    EXPECT_EQ(loginOf(-1, 0), noLogin);
}

TEST(Login, OfAnotherAccountsProcessWithTheSameIdIsNotUsed) {
    const Session session;
    EXPECT_EQ(loginOf(session.pid(), other + 1), noLogin);
}

TEST(Login, OfAClientWhoseProcessTheKernelCannotShowIsNotUsed) {
    const Session session;  // has the id now
    const uid_t uid = ::geteuid() == 0 ? other : ::geteuid();
    const FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));  // without another end
    int process = -1;
    socklen_t size = sizeof process;
    ASSERT_NE(::getsockopt(socket.get(), SOL_SOCKET, peerProcess, &process, &size), 0);
    const bool kernelKnows = errno != ENOPROTOOPT;  // from 6.5 on
    const Peer peer = peerOf(socket.get(), {session.pid(), uid, uid});
    EXPECT_EQ(peer.login, kernelKnows ? noLogin : loginOf(session.pid(), uid));
    EXPECT_EQ(peer.uid, uid);
}

TEST(Login, TextNamesTheAccountAndItsNumber) {
    EXPECT_EQ(loginText(0, noLogin), "root (uid 0)");
    EXPECT_EQ(loginText(0, 0), "root (uid 0)");
    EXPECT_EQ(loginText(4123456789U, noLogin), "uid 4123456789");
    EXPECT_EQ(loginText(0, 4123456789U), "uid 4123456789, as root (uid 0)");
}

}  // namespace
}  // namespace adminhost
