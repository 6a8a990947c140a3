#pragma once

// Who made a request, as people know them.

#include <string>

#include <sys/types.h>

namespace adminhost {

/// "anna (uid 1000)": the account of the login session that the process belongs to, where the kernel knows it
/// (/proc/PID/loginuid), else that of the uid. Where the two differ: "anna (uid 1000), as root (uid 0)".
[[nodiscard]] std::string loginText(uid_t uid, pid_t pid);

}  // namespace adminhost
