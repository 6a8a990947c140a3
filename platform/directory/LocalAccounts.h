#pragma once

// The directory node of this machine's own accounts: the files /etc/passwd and /etc/group below the system root.
//
// Read by the C library's own file readers and not through the name service, which might enumerate a company. Users
// come before groups, each in file order. The node is read only (see DirectoryNode). docs/directory.md
// describes how a line becomes a record.

#include "platform/directory/Directory.h"
#include "platform/files/Path.h"
#include "platform/framework/Export.h"

#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

inline constexpr std::string_view localAccountsNodeName = "/Local";

/// The source of the node. All nodes opened from one source share one pass over the accounts as long as the files do
/// not change. With a file of UUIDs ("user:NAME UUID" or "group:NAME UUID" on each line), an account has the UUID in
/// that file or none, and a query fails if the file cannot be read. Without such a file, accounts have name-based
/// UUIDs. With a Kerberos realm, each user has the authentication authority of the principal NAME@REALM.
[[nodiscard]] ADMINHOST_EXPORT DirectoryNodeSource
localAccounts(std::optional<HostPath> uuidFile = std::nullopt, std::string kerberosRealm = {},
              const std::string& name = std::string(localAccountsNodeName));

}  // namespace adminhost
