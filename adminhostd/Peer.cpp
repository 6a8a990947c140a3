#include "adminhostd/Peer.h"

#include "adminhostd/UnitProcesses.h"
#include "platform/files/FileDescriptor.h"

#include <algorithm>
#include <array>
#include <cerrno>

#include <poll.h>

#ifndef SO_PEERPIDFD
#define SO_PEERPIDFD 77  // the C library's headers may be older than the kernel
#endif

namespace adminhost {
namespace {

constexpr std::size_t usualGroups = 64;
constexpr std::size_t mostGroups = 65'536;  ///< that the kernel allows
constexpr std::size_t longestUnit = 255;

std::vector<gid_t> groupsOf(int socket) {
    std::vector<gid_t> groups(usualGroups);
    for (;;) {
        auto size = static_cast<socklen_t>(groups.size() * sizeof(gid_t));
        const bool read = ::getsockopt(socket, SOL_SOCKET, SO_PEERGROUPS, groups.data(), &size) == 0;
        const std::size_t count = size / sizeof(gid_t);
        if (!read && (errno != ERANGE || count <= groups.size() || count > mostGroups)) {
            return {};  // a kernel before 4.13: the process's first group alone counts
        }
        groups.resize(count);
        if (read) {
            return groups;
        }
    }
}

/// The process at the other end, by which its end can be seen however often its id is used again.
class PeerProcess {
  public:
    explicit PeerProcess(int socket) {
        int descriptor = -1;
        socklen_t size = sizeof descriptor;
        if (::getsockopt(socket, SOL_SOCKET, SO_PEERPIDFD, &descriptor, &size) == 0) {
            _descriptor = FileDescriptor(descriptor);
        } else {
            // A process that has been reaped has no descriptor. A kernel before 6.5 has none for any process.
            _isLost = errno != ENOPROTOOPT;
        }
    }

    [[nodiscard]] bool hasEnded() const {
        pollfd entry{_descriptor.get(), POLLIN, 0};
        return _isLost || (_descriptor.isOpen() && ::poll(&entry, 1, 0) != 0);
    }

  private:
    FileDescriptor _descriptor;
    bool _isLost = false;
};

}  // namespace

bool Peer::isInGroup(gid_t group) const noexcept {
    return gid == group || std::find(groups.begin(), groups.end(), group) != groups.end();
}

Peer peerOf(int socket, const ucred& credentials) {
    Peer peer{credentials.uid, credentials.gid, credentials.pid};
    peer.groups = groupsOf(socket);
    const PeerProcess process(socket);
    const uid_t login = loginOf(peer.pid, peer.uid);
    std::string unit = unitOf(controlGroupOf(peer.pid));
    if (!process.hasEnded()) {
        peer.login = login;
        peer.unit = std::move(unit);
    }
    return peer;
}

std::string unitOf(std::string_view controlGroup) {
    constexpr std::array suffixes{".service", ".scope", ".socket", ".mount", ".swap"};
    constexpr std::string_view allowed = "abcdefghijklmnopqrstuvwxyzABCDEFGHIJKLMNOPQRSTUVWXYZ0123456789:-_.\\@";
    while (!controlGroup.empty()) {
        const std::size_t slash = controlGroup.find('/');
        const std::string_view part = controlGroup.substr(0, slash);
        controlGroup.remove_prefix(slash == std::string_view::npos ? controlGroup.size() : slash + 1);
        if (std::any_of(suffixes.begin(), suffixes.end(), [&](const char* suffix) { return part.ends_with(suffix); })) {
            const bool valid = part.size() <= longestUnit && part.find_first_not_of(allowed) == std::string_view::npos;
            return valid ? std::string(part) : std::string();
        }
    }
    return {};
}

}  // namespace adminhost
