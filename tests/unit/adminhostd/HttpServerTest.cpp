// The server's connections when the system refuses what it needs for one.

#include "adminhostd/Http.h"
#include "tests/support/TemporaryRoot.h"
#include "tests/support/UnixHttp.h"

#include <cerrno>
#include <cstring>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/epoll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <unistd.h>

namespace {

bool failNextAdd = false;

}  // namespace

/// Used by the HTTP library too.
extern "C" int epoll_ctl(int descriptor, int operation, int other, epoll_event* event) noexcept {
    if (operation == EPOLL_CTL_ADD && failNextAdd) {
        failNextAdd = false;
        errno = ENOSPC;
        return -1;
    }
    return static_cast<int>(::syscall(SYS_epoll_ctl, descriptor, operation, other, event));
}

namespace adminhost {
namespace {

using namespace std::chrono_literals;

FileDescriptor listenAt(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    FileDescriptor listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    EXPECT_EQ(::bind(listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    EXPECT_EQ(::listen(listener.get(), 16), 0);
    return listener;
}

class Server : public ::testing::Test {
  protected:
    /// Lets the server work for a while.
    void serveFor(std::chrono::milliseconds time) {
        const auto end = std::chrono::steady_clock::now() + time;
        while (std::chrono::steady_clock::now() < end) {
            std::vector<pollfd> entries;
            server.addTo(entries);
            ::poll(entries.data(), entries.size(), 10);
            static_cast<void>(server.run(entries));
        }
    }
    [[nodiscard]] bool accepting() const {
        std::vector<pollfd> entries;
        server.addTo(entries);
        return entries.back().fd >= 0;
    }

    const test::TemporaryRoot root;
    const std::string socket = root.path("/socket");
    HttpServer server{listenAt(socket), RequestBounds(), [](Exchange&) {
                          return HttpAnswer{200, Dictionary{{"served", true}}, {}};
                      }};
};

TEST_F(Server, ConnectionThatCannotBeWatchedIsClosedAndLaterOnesAreServed) {
    failNextAdd = true;
    test::UnixHttp refused(socket);
    serveFor(50ms);
    ASSERT_FALSE(failNextAdd) << "the connection was not accepted";
    EXPECT_TRUE(refused.closedWithin(0ms));
    EXPECT_FALSE(accepting()) << "it waits, instead of trying again and again";
    serveFor(1100ms);  // the pause after a shortage
    ASSERT_TRUE(accepting());
    test::UnixHttp client(socket);
    client.begin("GET", "/");
    serveFor(50ms);
    EXPECT_EQ(client.reply().status, 200);
}

}  // namespace
}  // namespace adminhost
