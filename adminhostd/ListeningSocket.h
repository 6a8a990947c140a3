#pragma once

// The Unix socket that clients connect to.

#include "platform/files/FileDescriptor.h"

#include <optional>
#include <string>

#include <sys/types.h>

namespace adminhost {

/// Why no socket can be at the path, with a suggested fix: its length, or a file that is not a socket. Returns nullopt
/// for a free path and for a socket, living or dead.
[[nodiscard]] std::optional<std::string> socketPathProblem(const std::string& path);

/// Listens at the path with mode 0660. The socket gets its group and mode in a private directory and is then moved to
/// its path, so that nobody ever meets it with other rights. A socket that a dead daemon left is replaced; one that a
/// living daemon serves, and anything that is not a socket, is an error. The path is removed with its owner.
class ListeningSocket {
  public:
    static constexpr gid_t sameGroup = static_cast<gid_t>(-1);

    /// Throws std::runtime_error with what is wrong and a suggested fix.
    ListeningSocket(std::string path, gid_t group);
    ListeningSocket(const ListeningSocket&) = delete;
    ListeningSocket& operator=(const ListeningSocket&) = delete;
    ~ListeningSocket() { remove(); }

    /// Hands out the descriptor; the path stays this object's.
    [[nodiscard]] FileDescriptor take() { return std::move(_socket); }
    /// Removes the path, unless another daemon has taken it over.
    void remove() noexcept;

  private:
    std::string _path;
    FileDescriptor _socket;
    dev_t _device = 0;
    ino_t _inode = 0;
};

/// The group's number; ListeningSocket::sameGroup for an empty name. Throws std::runtime_error for an unknown group.
[[nodiscard]] gid_t groupOf(const std::string& name);

}  // namespace adminhost
