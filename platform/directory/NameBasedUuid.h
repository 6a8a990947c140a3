#pragma once

// UUIDs that are computed from names.

#include "platform/framework/Export.h"
#include "platform/text/Uuid.h"

#include <string_view>

namespace adminhost {

/// The name-based UUID (RFC 4122, version 5, SHA-1) of a name in a namespace.
[[nodiscard]] ADMINHOST_EXPORT Uuid nameBasedUuid(const Uuid& space, std::string_view name);

/// The namespace of the UUIDs that accounts of this machine get: "user:NAME" and "group:NAME" are the names in it.
/// The service's own tool computes the same ones, so it never changes.
inline constexpr Uuid localAccountsNamespace = {0x3f, 0x0e, 0x2a, 0x54, 0x8c, 0x5b, 0x5d, 0x0e,
                                                0x9a, 0x41, 0x6d, 0x1f, 0x0c, 0x7b, 0x2e, 0x90};

}  // namespace adminhost
