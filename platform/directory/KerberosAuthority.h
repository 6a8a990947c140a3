#pragma once

// The values of "dsAttrTypeStandard:AuthenticationAuthority" for accounts with a Kerberos principal.

#include "platform/framework/Export.h"

#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

/// The principal of an account name in a realm: NAME@REALM, with the characters of the name quoted that separate the
/// parts of a principal.
[[nodiscard]] ADMINHOST_EXPORT std::string kerberosPrincipalOf(std::string_view name, std::string_view realm);

/// ";Kerberosv5;;PRINCIPAL;REALM;": the realm is what follows the last unquoted "@" of the principal, else the default
/// realm. Returns nullopt if the principal is empty or has a ";", which would be read as the end of a field.
[[nodiscard]] ADMINHOST_EXPORT std::optional<std::string> kerberosAuthority(std::string_view principal,
                                                                            std::string_view defaultRealm);

}  // namespace adminhost
