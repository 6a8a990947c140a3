#pragma once

// A directory query on one connection to an LDAP server.

#include "platform/directory/LdapConnection.h"
#include "platform/directory/LdapMapping.h"

#include <string>
#include <vector>

namespace adminhost {

/// So many values are looked up by one search.
inline constexpr std::size_t ldapValuesInOneSearch = 200;

/// Users, then groups, each by DN and each DN once. With a maximum, the first so many that the server returns.
[[nodiscard]] Result<std::vector<DirectoryRecord>> ldapRecords(LdapConnection& connection, const LdapMapping& mapping,
                                                               const std::string& node, const DirectoryQuery& query);

}  // namespace adminhost
