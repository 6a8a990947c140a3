#pragma once

// UUIDs and their canonical texts.

#include "platform/framework/Export.h"

#include <array>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

/// The 16 bytes of a UUID in the order of its text.
using Uuid = std::array<std::uint8_t, 16>;

/// Reads the canonical text of 36 characters, digits in either case. Returns nullopt for any other text.
[[nodiscard]] ADMINHOST_EXPORT std::optional<Uuid> uuidOf(std::string_view text) noexcept;

/// The canonical text, upper case.
[[nodiscard]] ADMINHOST_EXPORT std::string textOf(const Uuid& uuid);

/// A fresh random one (RFC 4122, version 4). Throws std::runtime_error if the system has no random bytes.
[[nodiscard]] ADMINHOST_EXPORT Uuid randomUuid();

}  // namespace adminhost
