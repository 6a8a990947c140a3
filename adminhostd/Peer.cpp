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

/// A descriptor for the process at the other end; closed if the kernel has none to give (before 6.5).
FileDescriptor processOf(int socket) {
    int descriptor = -1;
    socklen_t size = sizeof descriptor;
    return FileDescriptor(::getsockopt(socket, SOL_SOCKET, SO_PEERPIDFD, &descriptor, &size) == 0 ? descriptor : -1);
}

bool hasEnded(const FileDescriptor& process) {
    pollfd entry{process.get(), POLLIN, 0};
    return process.isOpen() && ::poll(&entry, 1, 0) != 0;
}

}  // namespace

bool Peer::isInGroup(gid_t group) const noexcept {
    return gid == group || std::find(groups.begin(), groups.end(), group) != groups.end();
}

Peer peerOf(int socket, const ucred& credentials) {
    Peer peer{credentials.uid, credentials.gid, credentials.pid};
    peer.groups = groupsOf(socket);
    const FileDescriptor process = processOf(socket);
    const uid_t login = loginOf(peer.pid, peer.uid);
    std::string unit = unitOf(controlGroupOf(peer.pid));
    if (!hasEnded(process)) {
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
