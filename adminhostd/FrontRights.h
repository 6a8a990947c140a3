#pragma once

// The rights of the front: it reads what strangers send, so it gives up everything that it does not need for that.
//
// Started as the superuser it changes to an account of its own. In every case it gives up its capabilities and the
// right to gain privileges, can open files for reading only, in the few directories that it needs (Landlock, where the
// kernel has it), and can use no system call but those of its work: it starts no program, and opens no socket except
// Unix ones.

#include "adminhostd/Options.h"

#include <optional>
#include <string>

#include <sys/types.h>

namespace adminhost {

struct FrontAccount {
    uid_t user;
    gid_t group;
};

/// The account that the front changes to; nullopt if it keeps the daemon's: when not started as the superuser, and
/// below another root unless the configuration names an account. Throws std::runtime_error with a suggested fix if the
/// account does not exist or is the superuser.
[[nodiscard]] std::optional<FrontAccount> frontAccount(const Options& options);

/// Gives up the rights, for the rest of the process. Throws std::runtime_error if the system does not let it.
void dropFrontRights(const std::optional<FrontAccount>& account, const Options& options);

}  // namespace adminhost
