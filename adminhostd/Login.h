#pragma once

// The account of the person who made a request.

#include <string>

#include <sys/types.h>

namespace adminhost {

/// The value that the kernel shows for a process that no login session started.
constexpr uid_t noLogin = static_cast<uid_t>(-1);

/// The account of the login session that the process belongs to (/proc/PID/loginuid); noLogin if there is none, or if
/// the process has ended. Must be asked while the process is known to exist: its id may become that of another process.
/// The answer is noLogin too if the process with that id runs as an account other than `uid`, unless that is root,
/// which also owns the files in /proc of processes that cannot be inspected.
[[nodiscard]] uid_t loginOf(pid_t pid, uid_t uid) noexcept;

/// The account's name, by all the machine's account sources: this may ask a directory service. Empty if it has none.
[[nodiscard]] std::string accountNameOf(uid_t uid);

/// "anna (uid 1000)": the account of the login session, if there is one, else that of the uid. If the two differ:
/// "anna (uid 1000), as root (uid 0)".
[[nodiscard]] std::string loginText(uid_t uid, uid_t login);

}  // namespace adminhost
