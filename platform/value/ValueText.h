#pragma once

// The texts of values, and the booleans that values and texts mean.

#include "platform/framework/Export.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

/// The text of a value in log lines, messages and statements. Null is "(null)", true "1", false "0". A number is its
/// shortest decimal form without an exponent (100000.0 is "100000", a very large or small one has all its digits; "inf"
/// and "nan" if digits cannot show it). A string is itself, a date "2026-01-31 08:00:00 +0000" (UTC), data its bytes in
/// hexadecimal between angle brackets. Arrays and dictionaries are written on indented lines between parentheses and
/// braces.
[[nodiscard]] ADMINHOST_EXPORT std::string textOf(const Value& value);
/// A missing text is "(null)".
[[nodiscard]] ADMINHOST_EXPORT std::string textOf(const std::optional<std::string>& text);
/// "DOMAIN (CODE): DESCRIPTION", or "DOMAIN (CODE)" for an error without description; a missing error is "(null)".
[[nodiscard]] ADMINHOST_EXPORT std::string textOf(const Error& error);
[[nodiscard]] ADMINHOST_EXPORT std::string textOf(const std::optional<Error>& error);

/// The boolean meaning of a stored or requested value: a boolean as it is, a number if it is not zero, a string if its
/// first character other than a blank (space, tab) is one of Y y T t or 1 to 9. Anything else is false.
[[nodiscard]] ADMINHOST_EXPORT bool booleanOf(const Value& value) noexcept;
/// The boolean meaning of a change entry's flags: as booleanOf, but a string's leading zeros are skipped too ("01" is
/// true).
[[nodiscard]] ADMINHOST_EXPORT bool flagOf(const Value& value) noexcept;

}  // namespace adminhost
