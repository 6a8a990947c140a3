#include "adminhostctl/Bridge.h"

#include "adminhostctl/Connection.h"
#include "platform/files/FileDescriptor.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <csignal>
#include <cstring>

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost::ctl {
namespace {

/// What has been read on one side and not yet been written on the other.
class Flow {
  public:
    [[nodiscard]] bool isEmpty() const noexcept { return _begin == _end; }
    /// Whether the side that is read has ended.
    [[nodiscard]] bool hasEnded() const noexcept { return _ended; }

    /// Call when it is empty and the descriptor can be read.
    void readFrom(int descriptor) noexcept {
        const ssize_t count = ::read(descriptor, _bytes.data(), _bytes.size());
        if (count > 0) {
            _begin = 0;
            _end = static_cast<std::size_t>(count);
        } else {
            _ended = count == 0 || errno != EINTR;
        }
    }
    /// Call when the descriptor can be written. Returns false if nobody reads it any more. Does not wait: a pipe that
    /// can be written has room for PIPE_BUF bytes.
    [[nodiscard]] bool writeTo(int descriptor) noexcept {
        const std::size_t most = std::min<std::size_t>(_end - _begin, PIPE_BUF);
        ssize_t count = ::send(descriptor, &_bytes.at(_begin), _end - _begin, MSG_DONTWAIT | MSG_NOSIGNAL);
        if (count < 0 && errno == ENOTSOCK) {
            count = ::write(descriptor, &_bytes.at(_begin), most);
        }
        if (count < 0) {
            return errno == EAGAIN || errno == EINTR;
        }
        _begin += static_cast<std::size_t>(count);
        return true;
    }
    /// Nothing more can be written: drops what is left, and reads no more.
    void abandon() noexcept {
        _begin = _end;
        _ended = true;
    }

  private:
    std::array<char, 65536> _bytes{};
    std::size_t _begin = 0;
    std::size_t _end = 0;
    bool _ended = false;
};

FileDescriptor connectedTo(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof address.sun_path) {
        throw usageError("--socket: \"" + path + "\" is not the path of a socket");
    }
    path.copy(address.sun_path, path.size());
    FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    if (!socket.isOpen() || ::connect(socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
        throwNotConnected(path, errno, std::strerror(errno));
    }
    return socket;
}

void carry(int socket) {
    Flow up;    // to the daemon
    Flow down;  // from it
    bool halfClosed = false;
    while (!down.hasEnded() || !down.isEmpty()) {
        const bool readsInput = up.isEmpty() && !up.hasEnded();
        std::array<pollfd, 3> waited{
            pollfd{readsInput ? STDIN_FILENO : -1, POLLIN, 0},
            pollfd{socket,
                   static_cast<short>((down.isEmpty() && !down.hasEnded() ? POLLIN : 0) | (up.isEmpty() ? 0 : POLLOUT)),
                   0},
            pollfd{STDOUT_FILENO, static_cast<short>(down.isEmpty() ? 0 : POLLOUT), 0}};
        if (waited[1].events == 0) {
            waited[1].fd = -1;  // its end would be reported again and again
        }
        if (::poll(waited.data(), waited.size(), -1) < 0) {
            continue;  // interrupted
        }
        if (waited[0].revents != 0) {
            up.readFrom(STDIN_FILENO);
        }
        if ((waited[1].revents & (POLLOUT | POLLERR)) != 0 && !up.isEmpty() && !up.writeTo(socket)) {
            up.abandon();  // the daemon may have sent an answer before it closed the connection
        }
        if ((waited[1].revents & (POLLIN | POLLHUP | POLLERR)) != 0 && down.isEmpty() && !down.hasEnded()) {
            down.readFrom(socket);
        }
        if (waited[2].revents != 0 &&
            (down.isEmpty() ? (waited[2].revents & (POLLERR | POLLHUP)) != 0 : !down.writeTo(STDOUT_FILENO))) {
            return;
        }
        if (up.hasEnded() && up.isEmpty() && !halfClosed) {
            ::shutdown(socket, SHUT_WR);
            halfClosed = true;
        }
    }
}

}  // namespace

ExitStatus bridge(const Context& context, std::span<const std::string> /*arguments*/) {
    if (context.service.isRemote()) {
        throw usageError("bridge connects with the daemon of this machine; --host cannot be used with it");
    }
    static_cast<void>(std::signal(SIGPIPE, SIG_IGN));
    context.out << bridgeBegin << std::flush;
    const FileDescriptor socket = connectedTo(context.service.place());
    context.out << bridgeGreeting << std::flush;
    if (context.out) {
        carry(socket.get());
    }
    return ExitStatus::done;
}

}  // namespace adminhost::ctl
