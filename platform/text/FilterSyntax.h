#pragma once

// The syntax of LDAP search filters (RFC 4515), checked without an LDAP library: the daemon's front reads filters in
// its configuration and is not linked to one.

#include "platform/framework/Export.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

struct ADMINHOST_EXPORT FilterProblem {
    std::size_t offset = 0;  ///< bytes before the first one that does not fit
    std::string expected;    ///< "a closing parenthesis"
};

/// Returns the first mistake in a filter; nullopt if it is one filter in parentheses. Blanks are permitted between the
/// filters of a list, "(& (a=b) (c=d))". Filters may be nested 100 deep.
[[nodiscard]] ADMINHOST_EXPORT std::optional<FilterProblem> ldapFilterProblem(std::string_view filter);

/// Returns true for an attribute's name or number with its options, if any: "uid", "2.5.4.3", "cn;lang-de".
[[nodiscard]] ADMINHOST_EXPORT bool isLdapAttribute(std::string_view text) noexcept;

}  // namespace adminhost
