#pragma once

// What an account of this machine may do, for a child that is to run as that account.

#include "platform/framework/Export.h"
#include "platform/task/StartChild.h"
#include "platform/value/Result.h"

#include <sys/stat.h>
#include <sys/types.h>

namespace adminhost {

/// The account with all its groups, as the system's databases have them; they are asked again after ten seconds. A user
/// id without an account has no group (65534). Fails (domain "posix") if the databases cannot be asked.
[[nodiscard]] ADMINHOST_EXPORT Result<ChildRights> rightsOfAccount(uid_t user);

/// Returns true if owner, group and mode let the account create files in the directory. Access lists do not count.
[[nodiscard]] ADMINHOST_EXPORT bool mayCreateFiles(const ChildRights& account, const struct stat& directory) noexcept;

/// Returns true if the owner is root, or certainly an account outside of this process's user namespace, over whose
/// files its root has no power.
[[nodiscard]] ADMINHOST_EXPORT bool isOfRoot(const struct stat& file) noexcept;
/// The same, also if the owner is only possibly outside: the kernel shows all such owners as one user id, which can be
/// that of an account inside too.
[[nodiscard]] ADMINHOST_EXPORT bool isOfRootOrOutside(const struct stat& file) noexcept;

}  // namespace adminhost
