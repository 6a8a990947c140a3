#pragma once

// Who may use which camera or workflow, as the database has it: disabled ones and accounts that the directory does not
// know are included, unlike in the listings of cameras and workflows.

#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <cstdint>
#include <span>
#include <string>
#include <vector>

namespace lumio {

/// Reads all cameras and workflows with their access lists in three statements, and looks all people up at once. Each
/// is a dictionary with "section" ("cameras", "workflows"), "_id_", "name" (a workflow's in the best of the languages),
/// "bundle_path" (of a workflow), "disabled", "access_control_enabled" and "allowedUsersAndGroups": directory entries,
/// or "guid" and "_id_" alone if the directory does not know the account. Fails if the database or the directory fails:
/// an account would look unknown.
[[nodiscard]] adminhost::Result<adminhost::Array> accessOverview(const std::vector<std::string>& languages);

/// From how many lists an account was removed, and how many still have it.
struct AccessRemoval {
    std::uint64_t removed = 0;
    std::uint64_t left = 0;
};

/// Removes the account from the access lists of the named resources (UUIDs), of all without names, with the
/// configuration tool, which is given the UUID in place of a short name: an account that the directory does not know
/// has none. Reports each removal, and each entry that is still in the database afterwards. Fails, and runs nothing, if
/// the directory knows the account or cannot be asked, or if the database cannot be read. If the database cannot be
/// read afterwards, it reports what the tool has removed as unverified, and fails.
[[nodiscard]] adminhost::Result<AccessRemoval> removeUnknownAccount(const std::string& uuid,
                                                                    std::span<const std::string> resources);

}  // namespace lumio
