#pragma once

// Dates in the machine's time zone.

#include "platform/framework/Export.h"

#include <chrono>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

/// Local time in the form "%Y-%m-%d %H:%M:%S". The whole text must be such a date, and one that the calendar has.
/// Inside a daylight-saving gap the C library's choice holds. Returns nullopt for any other text.
[[nodiscard]] ADMINHOST_EXPORT std::optional<std::chrono::sys_seconds> localDateOf(std::string_view text);
/// The same form, for writing. Follows a change of the machine's time zone at once; reading does so within a second.
[[nodiscard]] ADMINHOST_EXPORT std::string localTextOf(std::chrono::sys_seconds date);

}  // namespace adminhost
