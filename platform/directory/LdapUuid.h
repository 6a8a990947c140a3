#pragma once

// UUIDs as LDAP servers store them.

#include "platform/directory/LdapNode.h"
#include "platform/text/Uuid.h"

#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

/// The value of an attribute with the UUID; text is in lower case.
[[nodiscard]] std::string ldapValueOf(const Uuid& uuid, LdapNodeSettings::UuidForm form);
[[nodiscard]] std::optional<Uuid> uuidOfLdapValue(std::string_view value, LdapNodeSettings::UuidForm form);

}  // namespace adminhost
