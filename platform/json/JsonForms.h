#pragma once

// Texts of the values that JSON has no form of its own for.

#include "platform/value/Value.h"

#include <optional>
#include <string>
#include <string_view>

namespace adminhost::json {

/// "2026-01-31T08:00:00Z"; a year outside 0000 to 9999 carries a sign and at least six digits.
[[nodiscard]] std::string dateText(Date date);
/// The date whose dateText() is exactly this text; nothing for any other text.
[[nodiscard]] std::optional<Date> dateOf(std::string_view text);

/// Base64 with padding and without line feeds (RFC 4648, section 4).
[[nodiscard]] std::string base64Text(const Data& data);
/// Nothing for a text that base64Text() does not write.
[[nodiscard]] std::optional<Data> base64Data(std::string_view text);

}  // namespace adminhost::json
