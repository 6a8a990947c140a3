#pragma once

// Records of entries that an LDAP server returned.

#include "platform/directory/LdapMapping.h"

#include <optional>
#include <span>
#include <string>
#include <vector>

namespace adminhost {

/// The record of an entry, with those of the attributes that it has. Returns nullopt if it has names but none that a
/// property list can carry: a repaired name would name another account. Members by DN are not included.
[[nodiscard]] std::optional<DirectoryRecord> ldapRecordOf(const LdapMapping& mapping, AccountKind kind,
                                                          const std::string& node, const LdapEntry& entry,
                                                          std::span<const std::string> attributes);

/// The names of an entry that can be carried, the one in its DN first.
[[nodiscard]] std::vector<std::string> ldapNamesOf(const LdapMapping& mapping, AccountKind kind,
                                                   const LdapEntry& entry);

/// The value of a DN's first component if its attribute is this one; empty otherwise.
[[nodiscard]] std::string ldapRdnValue(const std::string& dn, std::string_view attribute);

}  // namespace adminhost
