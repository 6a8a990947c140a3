#pragma once

// The account of the person who made a request.

#include <string>

#include <sys/types.h>

namespace adminhost {

/// "anna (uid 1000)": the account of the login session that the process belongs to, if the kernel knows it
/// (/proc/PID/loginuid), else that of the uid. If the two differ: "anna (uid 1000), as root (uid 0)".
[[nodiscard]] std::string loginText(uid_t uid, pid_t pid);

}  // namespace adminhost
