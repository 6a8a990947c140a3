#pragma once

// The options of the verbs that look back ("history", "audit"): from when on, by whom, and of what.

#include "adminhostctl/Verb.h"
#include "platform/value/Value.h"

#include <optional>
#include <string_view>

namespace adminhost::ctl {

inline constexpr std::string_view sinceOption = "--since";
inline constexpr std::string_view userOption = "--user";
inline constexpr std::string_view keyOption = "--key";

/// The moment that the option --since names: a date, "today" or "yesterday" (their first second here), or a time ago
/// ("90min", "2h", "3d"). nullopt without the option. Throws Failure(usage) for another text.
[[nodiscard]] std::optional<Date> sinceOf(const Context& context);

}  // namespace adminhost::ctl
