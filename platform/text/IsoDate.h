#pragma once

// Dates as ISO 8601 writes them, in UTC and whole seconds: "2026-01-31T08:00:00Z".

#include "platform/framework/Export.h"

#include <chrono>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

/// A year outside 0000 to 9999 is written with a sign and at least six digits; a moment whose year exceeds 32 bits is
/// written as its seconds since 1970.
[[nodiscard]] ADMINHOST_EXPORT std::string isoTextOf(std::chrono::sys_seconds date);

/// The date whose isoTextOf() is exactly this text; nullopt for any other text.
[[nodiscard]] ADMINHOST_EXPORT std::optional<std::chrono::sys_seconds> isoDateOf(std::string_view text);

/// Returns true for the years 0000 to 9999, whose texts all have the same length.
[[nodiscard]] ADMINHOST_EXPORT bool hasFourDigitYear(std::chrono::sys_seconds date) noexcept;

}  // namespace adminhost
