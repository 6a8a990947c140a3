#pragma once

// The Unix socket that clients connect to.

#include "platform/files/FileDescriptor.h"

#include <optional>
#include <string>

#include <sys/types.h>

namespace adminhost {

/// Returns why no socket can be at the path, with a suggested fix: its length, or a file that is not a socket. Returns
/// nullopt for a free path and for a socket, whether a daemon serves it or not.
[[nodiscard]] std::optional<std::string> socketPathProblem(const std::string& path);

/// Listens at the path with mode 0660. The socket gets its group and mode in a private directory and is then moved to
/// its path, so that it is never reachable with other rights. A socket that a dead daemon left is replaced; one that a
/// running daemon serves, and anything that is not a socket, is an error. The destructor removes the path.
class ListeningSocket {
  public:
    static constexpr gid_t sameGroup = static_cast<gid_t>(-1);

    /// Throws std::runtime_error with a description and a suggested fix.
    ListeningSocket(std::string path, gid_t group);
    /// Serves a socket that the service manager has created. It must listen at the path, which stays there at the end.
    /// Throws as above.
    ListeningSocket(FileDescriptor inherited, const std::string& path);
    ListeningSocket(const ListeningSocket&) = delete;
    ListeningSocket& operator=(const ListeningSocket&) = delete;
    ~ListeningSocket() { remove(); }

    [[nodiscard]] int descriptor() const noexcept { return _socket.get(); }
    /// Stops listening, in this process.
    void close() noexcept { _socket.close(); }
    /// Removes the path, unless another daemon has taken it over.
    void remove() noexcept;

  private:
    std::string _path;
    FileDescriptor _socket;
    dev_t _device = 0;
    ino_t _inode = 0;
};

/// The socket that the service manager passes to this process (LISTEN_FDS); empty if it passes none. Removes the
/// variables, so that no child believes that the socket is its own. Throws std::runtime_error if it passes several.
[[nodiscard]] FileDescriptor inheritedSocket();

/// The group's number; ListeningSocket::sameGroup for an empty name. Throws std::runtime_error for an unknown group.
[[nodiscard]] gid_t groupOf(const std::string& name);

}  // namespace adminhost
