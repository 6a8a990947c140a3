#pragma once

// The people of a group, and the groups of a person, in an LDAP server.

#include "platform/directory/LdapConnection.h"
#include "platform/directory/LdapMapping.h"

#include <string>
#include <vector>

namespace adminhost {

/// The logins of the members that a group's entry lists by DN. A server that returns only a part of a long list (a
/// range) is asked for the rest. A DN that names the login is not looked up.
[[nodiscard]] Result<std::vector<std::string>> ldapMembersByDn(LdapConnection& connection, const LdapMapping& mapping,
                                                               const LdapEntry& group);

/// The groups of a person: those that list the login or the DN, the primary group, and those that list one of these
/// groups, 8 deep. Groups are searched for by member; no group's members are read. Each group once, by DN.
[[nodiscard]] Result<std::vector<DirectoryRecord>> ldapGroupsOf(LdapConnection& connection, const LdapMapping& mapping,
                                                                const DirectoryRecord& person,
                                                                const std::vector<std::string>& attributes);

}  // namespace adminhost
