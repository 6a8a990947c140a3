#include "adminhostd/ListeningSocket.h"

#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <stdexcept>
#include <thread>

#include <fcntl.h>
#include <fmt/format.h>
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

sockaddr_un addressOf(const std::string& path) {
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    if (path.empty() || path.size() >= sizeof address.sun_path) {
        fail(fmt::format("the socket's path {} must have 1 to {} bytes; choose a shorter one", path,
                         sizeof address.sun_path - 1));
    }
    std::memcpy(address.sun_path, path.c_str(), path.size() + 1);
    return address;
}

FileDescriptor newSocket() {
    FileDescriptor socket(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0));
    if (!socket.isOpen()) {
        failWithErrno("cannot make a socket");
    }
    return socket;
}

void refuseWhatIsInTheWay(const std::string& path, const sockaddr_un& address) {
    struct stat status {};
    if (::lstat(path.c_str(), &status) != 0) {
        return;
    }
    if (const auto problem = inTheWay(path)) {
        fail(*problem);
    }
    const FileDescriptor probe = newSocket();
    const int connected = ::connect(probe.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address);
    // A daemon whose backlog is full answers EAGAIN; it lives all the same.
    if (connected == 0 || errno == EAGAIN) {
        fail("another daemon serves " + path + "; stop it or choose another path");
    }
    if (errno != ECONNREFUSED && errno != ENOENT) {
        failWithErrno("cannot find out whether a daemon serves " + path);
    }
}

/// Whoever may read the directory may lock it: nobody is waited for without end.
void waitForLock(int directory, const std::string& path) {
    for (int tries = 0; ::flock(directory, LOCK_EX | LOCK_NB) != 0; ++tries) {
        if (errno != EWOULDBLOCK && errno != EINTR) {
            failWithErrno("cannot lock the directory of the socket " + path);
        }
        if (tries == 100) {
            fail("another process holds a lock on the directory of the socket " + path +
                 "; end it (fuser names it) or choose another path");
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(50));
    }
}

/// The private directory in which the socket is made.
class Cradle {
  public:
    explicit Cradle(const std::string& parent) : _path(parent + "/.adminhostd.XXXXXX") {
        if (::mkdtemp(_path.data()) == nullptr) {
            failWithErrno("cannot write in " + parent);
        }
        _directory = FileDescriptor(::open(_path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC));
    }
    Cradle(const Cradle&) = delete;
    Cradle& operator=(const Cradle&) = delete;
    ~Cradle() {
        ::unlink(socketPath().c_str());
        ::rmdir(_path.c_str());
    }

    [[nodiscard]] std::string socketPath() const { return _path + "/socket"; }
    /// As short as an address has to be, however long the path is.
    [[nodiscard]] std::string shortPath() const { return fmt::format("/proc/self/fd/{}/socket", _directory.get()); }

  private:
    std::string _path;
    FileDescriptor _directory;
};

}  // namespace

std::optional<std::string> inTheWay(const std::string& path) {
    struct stat status {};
    if (::lstat(path.c_str(), &status) != 0 || S_ISSOCK(status.st_mode)) {
        return std::nullopt;
    }
    return path + " is there already and is no socket; remove it or choose another path";
}

ListeningSocket::ListeningSocket(std::string path, gid_t group) : _path(std::move(path)) {
    const sockaddr_un address = addressOf(_path);
    const std::size_t slash = _path.rfind('/');
    const std::string parent = slash == std::string::npos ? "." : slash == 0 ? "/" : _path.substr(0, slash);
    // Two daemons that start at once take their turn here.
    const FileDescriptor lock(::open(parent.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    if (!lock.isOpen()) {
        failWithErrno("cannot use the directory of the socket " + _path);
    }
    waitForLock(lock.get(), _path);
    refuseWhatIsInTheWay(_path, address);

    const Cradle cradle(parent);
    const std::string place = cradle.socketPath();
    const sockaddr_un placeAddress = addressOf(cradle.shortPath());
    _socket = newSocket();
    struct stat status {};
    if (::bind(_socket.get(), reinterpret_cast<const sockaddr*>(&placeAddress), sizeof placeAddress) != 0 ||
        (group != sameGroup && ::lchown(place.c_str(), static_cast<uid_t>(-1), group) != 0) ||
        ::chmod(place.c_str(), 0660) != 0 || ::listen(_socket.get(), SOMAXCONN) != 0 ||
        ::lstat(place.c_str(), &status) != 0 || ::rename(place.c_str(), _path.c_str()) != 0) {
        failWithErrno("cannot make the socket " + _path);
    }
    _device = status.st_dev;
    _inode = status.st_ino;
}

void ListeningSocket::remove() noexcept {
    struct stat status {};
    if (_inode != 0 && ::lstat(_path.c_str(), &status) == 0 && status.st_dev == _device && status.st_ino == _inode) {
        ::unlink(_path.c_str());
    }
    _inode = 0;
}

}  // namespace adminhost
