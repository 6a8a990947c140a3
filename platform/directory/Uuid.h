#pragma once

// UUIDs of directory records.

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

/// The 16 bytes of a UUID in the order of its text.
using Uuid = std::array<std::uint8_t, 16>;

/// Reads the canonical text of 36 characters, digits in either case. Nothing for any other text.
[[nodiscard]] std::optional<Uuid> uuidOf(std::string_view text) noexcept;

/// The canonical text, upper case.
[[nodiscard]] std::string textOf(const Uuid& uuid);

/// The name-based UUID (RFC 4122, version 5, SHA-1) of a name in a namespace.
[[nodiscard]] Uuid nameBasedUuid(const Uuid& space, std::string_view name);

/// The namespace of the UUIDs that accounts of this machine get: "user:NAME" and "group:NAME" are the names in it.
/// The service's own tool computes the same ones, so it never changes.
inline constexpr Uuid localAccountsNamespace = {0x3f, 0x0e, 0x2a, 0x54, 0x8c, 0x5b, 0x5d, 0x0e,
                                                0x9a, 0x41, 0x6d, 0x1f, 0x0c, 0x7b, 0x2e, 0x90};

}  // namespace adminhost
