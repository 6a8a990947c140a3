// What the service manager is told of the daemon's state.

#include "platform/files/FileDescriptor.h"
#include "tests/system/host/Host.h"
#include "tests/system/host/StartFixture.h"

#include <algorithm>
#include <csignal>

#include <gmock/gmock.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost::test {
namespace {

using testing::StartsWith;

struct Notification {
    std::string state;
    pid_t sender = 0;
};

class Notifications : public Start {
  protected:
    Notifications() {
        const fs::path path = directory / "notify";
        sockaddr_un address{};
        address.sun_family = AF_UNIX;
        path.string().copy(address.sun_path, sizeof address.sun_path - 1);
        EXPECT_EQ(::bind(_socket.get(), reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
        const timeval bound{10, 0};
        ::setsockopt(_socket.get(), SOL_SOCKET, SO_RCVTIMEO, &bound, sizeof bound);
        const int yes = 1;
        ::setsockopt(_socket.get(), SOL_SOCKET, SO_PASSCRED, &yes, sizeof yes);
        _options.environment = {"NOTIFY_SOCKET=" + path.string()};
    }

    /// The next one, waited for. Its state is empty if none comes.
    [[nodiscard]] Notification next() const {
        char text[64] = {};
        iovec place{text, sizeof text};
        alignas(cmsghdr) char room[CMSG_SPACE(sizeof(ucred))] = {};
        msghdr header{};
        header.msg_iov = &place;
        header.msg_iovlen = 1;
        header.msg_control = room;
        header.msg_controllen = sizeof room;
        const ssize_t size = ::recvmsg(_socket.get(), &header, 0);
        const cmsghdr* const part = size > 0 ? CMSG_FIRSTHDR(&header) : nullptr;
        if (part == nullptr) {
            return {};
        }
        ucred sender{};
        std::copy_n(CMSG_DATA(part), sizeof sender, reinterpret_cast<unsigned char*>(&sender));
        return {std::string(text, static_cast<std::size_t>(size)), sender.pid};
    }

    DaemonProcess::Options _options = withFixture();

  private:
    FileDescriptor _socket{::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)};
};

TEST_F(Notifications, OfReadinessComeFromTheFrontAndOfTheEndFromTheMonitor) {
    DaemonProcess daemon(_options);
    EXPECT_EQ(next().state, "READY=1");
    daemon.signal(SIGTERM);
    const Notification end = next();
    EXPECT_EQ(end.state, "STOPPING=1");
    EXPECT_EQ(end.sender, daemon.pid());
    EXPECT_EQ(daemon.wait(), 0);
}

TEST_F(Notifications, FrontThatEndsAloneDoesNotStopTheUnit) {
    const DaemonProcess daemon(_options);
    EXPECT_EQ(next().state, "READY=1");
    ::kill(daemon.frontPid(), SIGTERM);
    EXPECT_EQ(next().state, "READY=1") << "of the next front";
}

TEST_F(Notifications, StopAsksForTheTimeOfARunningWriteAlsoIfTheFrontHasDied) {
    for (const bool frontDies : {false, true}) {
        DaemonProcess daemon(_options);
        EXPECT_EQ(next().state, "READY=1");
        const UnixHttp client = startHeldWrite(daemon, daemon.directory(), "written");
        if (frontDies) {
            ::kill(daemon.frontPid(), SIGKILL);
            EXPECT_TRUE(daemon.waitForLog("the next one is started"));
        }
        daemon.signal(SIGTERM);
        Notification one = next();
        if (one.state == "READY=1") {  // the next front was there before the signal
            one = next();
        }
        EXPECT_EQ(one.state, "STOPPING=1");
        const Notification more = next();
        EXPECT_THAT(more.state, StartsWith("EXTEND_TIMEOUT_USEC=3"));
        EXPECT_EQ(more.state.size(), std::string("EXTEND_TIMEOUT_USEC=").size() + 9) << "more than 300 seconds";
        EXPECT_EQ(more.sender, daemon.pid());
        std::ofstream(daemon.directory() / "go").put('\n');
        EXPECT_EQ(daemon.wait(), 0);
    }
}

}  // namespace
}  // namespace adminhost::test
