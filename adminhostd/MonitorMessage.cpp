#include "adminhostd/MonitorMessage.h"

#include <cerrno>
#include <cstring>
#include <system_error>

#include <poll.h>
#include <sys/socket.h>
#include <sys/uio.h>

namespace adminhost {
namespace {

constexpr std::size_t descriptorMaximum = 2;

union ControlRoom {
    char bytes[CMSG_SPACE(descriptorMaximum * sizeof(int))];
    cmsghdr aligned;
};

/// Takes over every descriptor that came along. Returns false if there was anything else.
bool takeDescriptors(msghdr& header, std::array<FileDescriptor, descriptorMaximum>& descriptors) {
    std::size_t count = 0;
    for (cmsghdr* part = CMSG_FIRSTHDR(&header); part != nullptr; part = CMSG_NXTHDR(&header, part)) {
        if (part->cmsg_level != SOL_SOCKET || part->cmsg_type != SCM_RIGHTS) {
            return false;
        }
        const std::size_t here = (part->cmsg_len - CMSG_LEN(0)) / sizeof(int);
        for (std::size_t i = 0; i < here; ++i) {
            int number = -1;
            std::memcpy(&number, CMSG_DATA(part) + i * sizeof number, sizeof number);
            FileDescriptor descriptor(number);
            if (count < descriptors.size()) {
                descriptors.at(count++) = std::move(descriptor);
            }
        }
    }
    return (header.msg_flags & MSG_CTRUNC) == 0;
}

/// A packet without a byte is read like the end.
bool isClosed(int socket) {
    pollfd entry{socket, POLLIN, 0};
    return ::poll(&entry, 1, 0) > 0 && (entry.revents & POLLHUP) != 0;
}

}  // namespace

std::array<FileDescriptor, 2> monitorSocketPair() {
    int ends[2];
    if (::socketpair(AF_UNIX, SOCK_SEQPACKET | SOCK_CLOEXEC, 0, ends) != 0) {
        throw std::system_error(errno, std::generic_category(), "cannot create a socket pair");
    }
    return {FileDescriptor(ends[0]), FileDescriptor(ends[1])};
}

bool sendMonitorMessage(int socket, const MonitorMessage& message, std::span<const int> descriptors) {
    MonitorMessage copy = message;
    iovec place{&copy, sizeof copy};
    msghdr header{};
    header.msg_iov = &place;
    header.msg_iovlen = 1;
    ControlRoom room{};
    if (!descriptors.empty()) {
        header.msg_control = room.bytes;
        header.msg_controllen = CMSG_SPACE(descriptors.size_bytes());
        cmsghdr* part = CMSG_FIRSTHDR(&header);
        part->cmsg_level = SOL_SOCKET;
        part->cmsg_type = SCM_RIGHTS;
        part->cmsg_len = CMSG_LEN(descriptors.size_bytes());
        std::memcpy(CMSG_DATA(part), descriptors.data(), descriptors.size_bytes());
    }
    ssize_t sent = 0;
    do {
        sent = ::sendmsg(socket, &header, MSG_NOSIGNAL | MSG_DONTWAIT);
    } while (sent < 0 && errno == EINTR);
    return sent == static_cast<ssize_t>(sizeof copy);
}

ReceivedMessage receiveMonitorMessage(int socket) {
    using Kind = ReceivedMessage::Kind;
    ReceivedMessage received;
    // One byte more than a message, to notice a longer one.
    char bytes[sizeof(MonitorMessage) + 1] = {};
    iovec place{bytes, sizeof bytes};
    ControlRoom room{};
    msghdr header{};
    header.msg_iov = &place;
    header.msg_iovlen = 1;
    header.msg_control = room.bytes;
    header.msg_controllen = sizeof room.bytes;
    ssize_t size = 0;
    do {
        size = ::recvmsg(socket, &header, MSG_DONTWAIT | MSG_CMSG_CLOEXEC);
    } while (size < 0 && errno == EINTR);
    if (size < 0) {
        received.kind = errno == EAGAIN ? Kind::none : Kind::closed;
        return received;
    }
    if (size == 0 && isClosed(socket)) {
        received.kind = Kind::closed;
        return received;
    }
    const bool whole = takeDescriptors(header, received.descriptors);
    std::memcpy(&received.message, bytes, sizeof received.message);
    const auto kind = received.message.kind;
    const bool known = kind >= MonitorMessage::Kind::start && kind <= MonitorMessage::Kind::configuration;
    received.kind = whole && known && size == static_cast<ssize_t>(sizeof(MonitorMessage)) ? Kind::message  //
                                                                                           : Kind::malformed;
    return received;
}

}  // namespace adminhost
