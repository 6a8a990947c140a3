#include "adminhostd/ListeningSocket.h"

#include "adminhostd/PrivateDirectory.h"

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <chrono>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <stdexcept>
#include <thread>

#include <fcntl.h>
#include <fmt/format.h>
#include <grp.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

namespace adminhost {
namespace {

[[noreturn]] void fail(const std::string& text) {
    throw std::runtime_error(text);
}
[[noreturn]] void failWithErrno(const std::string& text) {
    fail(text + ": " + std::strerror(errno));
}

constexpr std::size_t pathMaximum = sizeof(sockaddr_un::sun_path) - 1;

sockaddr_un addressOf(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::memcpy(address.sun_path, path.data(), std::min(path.size(), pathMaximum));
    return address;
}

FileDescriptor newSocket() {
    FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!socket.isOpen()) {
        failWithErrno("cannot create a socket");
    }
    return socket;
}

void refuseLivingDaemon(const std::string& path, const sockaddr_un& address) {
    struct stat status {};
    if (::lstat(path.c_str(), &status) != 0) {
        return;
    }
    const FileDescriptor probe = newSocket();
    const int connected = ::connect(probe.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
    // EAGAIN comes from a running daemon whose backlog is full.
    if (connected == 0 || errno == EAGAIN) {
        fail("another daemon serves " + path + "; stop it or choose another path");
    }
    if (errno != ECONNREFUSED && errno != ENOENT) {
        fail(
            fmt::format("cannot find out whether a daemon serves {}, which belongs to uid {}: {}; stop that daemon and "
                        "remove the socket, or choose another path",
                        path, status.st_uid, std::strerror(errno)));
    }
}

/// Held while the socket is created: of two daemons that start at once, the second waits and then finds the first.
/// The locked file is beside the socket and private. A directory could be locked by any account that may read it.
class StartLock {
  public:
    explicit StartLock(const std::string& socketPath) : _path(socketPath + ".lock") {
        for (int tries = 0; !(open() && lock() && isInPlace()); ++tries) {
            if (tries == 100) {
                fail("another process holds a lock on " + _path + "; end it (fuser prints its process id)");
            }
            std::this_thread::sleep_for(std::chrono::milliseconds(50));
        }
    }
    StartLock(const StartLock&) = delete;
    StartLock& operator=(const StartLock&) = delete;
    ~StartLock() { ::unlink(_path.c_str()); }

  private:
    bool open() {
        _file = FileDescriptor(::open(_path.c_str(), O_RDWR | O_CREAT | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC, 0600));
        struct stat status {};
        if (!_file.isOpen() || ::fstat(_file.get(), &status) != 0) {
            failWithErrno("cannot create " + _path);
        }
        if (!S_ISREG(status.st_mode) || status.st_uid != ::geteuid() || (status.st_mode & 077U) != 0) {
            fail(_path + " is not a private file of this account; remove it");
        }
        return true;
    }
    bool lock() {
        if (::flock(_file.get(), LOCK_EX | LOCK_NB) == 0) {
            return true;
        }
        if (errno != EWOULDBLOCK && errno != EINTR) {
            failWithErrno("cannot lock " + _path);
        }
        return false;
    }
    /// Returns false if the daemon that held the lock before has removed its file at its end.
    bool isInPlace() const {
        struct stat ours {};
        struct stat there {};
        return ::fstat(_file.get(), &ours) == 0 && ::lstat(_path.c_str(), &there) == 0 && ours.st_dev == there.st_dev &&
               ours.st_ino == there.st_ino;
    }

    std::string _path;
    FileDescriptor _file;
};

/// The private directory in which the socket is created.
class SocketDirectory {
  public:
    explicit SocketDirectory(const std::string& parent) : _directory(createPrivateDirectory(parent, _path)) {}
    SocketDirectory(const SocketDirectory&) = delete;
    SocketDirectory& operator=(const SocketDirectory&) = delete;
    ~SocketDirectory() {
        ::unlink(socketPath().c_str());
        ::rmdir(_path.c_str());
    }

    [[nodiscard]] std::string socketPath() const { return _path + "/socket"; }
    /// As short as an address must be, however long the path is.
    [[nodiscard]] std::string shortPath() const { return fmt::format("/proc/self/fd/{}/socket", _directory.get()); }

  private:
    std::string _path;
    FileDescriptor _directory;
};

}  // namespace

std::optional<std::string> socketPathProblem(const std::string& path) {
    if (path.empty() || path.size() > pathMaximum) {
        return fmt::format("the socket path {} must have 1 to {} bytes; choose a shorter one", path, pathMaximum);
    }
    struct stat status {};
    if (::lstat(path.c_str(), &status) == 0 && !S_ISSOCK(status.st_mode)) {
        return path + " exists and is not a socket; remove it or choose another path";
    }
    return std::nullopt;
}

ListeningSocket::ListeningSocket(std::string path, gid_t group) : _path(std::move(path)) {
    if (const auto problem = socketPathProblem(_path)) {
        fail(*problem);
    }
    const std::size_t slash = _path.rfind('/');
    const std::string parent = slash == std::string::npos ? "." : slash == 0 ? "/" : _path.substr(0, slash);
    const StartLock lock(_path);
    refuseLivingDaemon(_path, addressOf(_path));

    const SocketDirectory directory(parent);
    const std::string place = directory.socketPath();
    const sockaddr_un placeAddress = addressOf(directory.shortPath());
    _socket = newSocket();
    struct stat status {};
    if (::bind(_socket.get(), reinterpret_cast<const sockaddr*>(&placeAddress), sizeof placeAddress) != 0 ||
        (group != sameGroup && ::lchown(place.c_str(), static_cast<uid_t>(-1), group) != 0) ||
        ::chmod(place.c_str(), 0660) != 0 || ::listen(_socket.get(), SOMAXCONN) != 0 ||
        ::lstat(place.c_str(), &status) != 0) {
        failWithErrno("cannot create the socket " + _path);
    }
    if (::rename(place.c_str(), _path.c_str()) != 0) {
        const int error = errno;
        struct stat former {};
        if (::lstat(_path.c_str(), &former) == 0) {  // of another account, in a directory with the sticky bit
            fail(fmt::format(
                "cannot replace the socket {}, which belongs to uid {}: {}; remove it, or choose another path", _path,
                former.st_uid, std::strerror(error)));
        }
        errno = error;
        failWithErrno("cannot create the socket " + _path);
    }
    _device = status.st_dev;
    _inode = status.st_ino;
}

ListeningSocket::ListeningSocket(FileDescriptor inherited, const std::string& path) : _socket(std::move(inherited)) {
    const auto number = [&](int option) {
        int value = -1;
        socklen_t size = sizeof value;
        return ::getsockopt(_socket.get(), SOL_SOCKET, option, &value, &size) == 0 ? value : -1;
    };
    if (number(SO_DOMAIN) != AF_UNIX || number(SO_TYPE) != SOCK_STREAM || number(SO_ACCEPTCONN) != 1) {
        fail(
            "the service manager passes something else than a listening Unix stream socket; use ListenStream= with a "
            "path in adminhostd.socket");
    }
    sockaddr_un address{};
    socklen_t size = sizeof address;
    if (::getsockname(_socket.get(), reinterpret_cast<sockaddr*>(&address), &size) != 0) {
        failWithErrno("the name of the service manager's socket");
    }
    const std::string place(address.sun_path, ::strnlen(address.sun_path, size - offsetof(sockaddr_un, sun_path)));
    if (place != path) {
        fail(
            fmt::format("the service manager's socket is \"{}\", and the daemon's is {}; ListenStream= in "
                        "adminhostd.socket and the daemon's configuration must name the same path",
                        place, path));
    }
    ::fcntl(_socket.get(), F_SETFL, O_NONBLOCK);
    ::fcntl(_socket.get(), F_SETFD, FD_CLOEXEC);
}

FileDescriptor inheritedSocket() {
    constexpr int first = 3;
    const auto numberIn = [](const char* name) {
        const char* const text = std::getenv(name);
        int number = 0;
        if (text != nullptr) {
            std::from_chars(text, text + std::strlen(text), number);  // 0 for anything else
        }
        return number;
    };
    const bool ours = numberIn("LISTEN_PID") == ::getpid();
    const int count = ours ? numberIn("LISTEN_FDS") : 0;
    for (const char* name : {"LISTEN_PID", "LISTEN_FDS", "LISTEN_FDNAMES"}) {
        ::unsetenv(name);
    }
    if (count > 1) {
        fail(fmt::format("the service manager passes {} sockets; name one in adminhostd.socket", count));
    }
    return FileDescriptor(count == 1 ? first : -1);
}

void ListeningSocket::remove() noexcept {
    struct stat status {};
    if (_inode != 0 && ::lstat(_path.c_str(), &status) == 0 && status.st_dev == _device && status.st_ino == _inode) {
        ::unlink(_path.c_str());
    }
    _inode = 0;
}

gid_t groupOf(const std::string& name) {
    if (name.empty()) {
        return ListeningSocket::sameGroup;
    }
    const group* entry = ::getgrnam(name.c_str());
    if (entry == nullptr) {
        throw std::runtime_error(
            fmt::format("unknown group \"{}\"; create it or correct socket_group in the configuration", name));
    }
    return entry->gr_gid;
}

}  // namespace adminhost
