#pragma once

// The process at the other end of a connection, as the kernel knew it when the connection was accepted.

#include "adminhostd/Login.h"

#include <string>
#include <string_view>
#include <vector>

#include <sys/socket.h>
#include <sys/types.h>

namespace adminhost {

struct Peer {
    uid_t uid = static_cast<uid_t>(-1);
    gid_t gid = static_cast<gid_t>(-1);
    pid_t pid = 0;
    uid_t login = noLogin;           ///< the account of its login session, as far as known
    std::vector<gid_t> groups = {};  ///< its supplementary groups
    std::string unit = {};           ///< the service manager's unit that it runs in, as far as known: "cron.service"

    [[nodiscard]] bool isInGroup(gid_t group) const noexcept;
};

/// The account and the process at the other end, whose credentials (SO_PEERCRED) the caller has read already.
/// Permissions rest on uid and groups only, which the kernel has recorded when the client connected. The login session
/// and the unit are read from /proc: they are left out if the process has ended, because its id may be another's.
[[nodiscard]] Peer peerOf(int socket, const ucred& credentials);

/// The unit in the path of a control group, as systemd names it: the first part that is a service, scope or other unit,
/// not a slice ("/user.slice/user-1000.slice/session-3.scope" is "session-3.scope"). Empty if there is none, or if the
/// name has characters that systemd does not allow.
[[nodiscard]] std::string unitOf(std::string_view controlGroup);

}  // namespace adminhost
