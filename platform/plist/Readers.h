#pragma once

// The readers of a property list's forms, and the errors that they share. For this room's sources only.

#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost::plist {

/// Each parses a whole list of its form. Returns nullopt, with the error, if it is not one or has more values.
[[nodiscard]] std::optional<Value> parseXml(std::string_view bytes, Error& error, std::size_t valuesMaximum);
[[nodiscard]] std::optional<Value> parseBinary(std::string_view bytes, Error& error, std::size_t valuesMaximum);

/// The text of the error for more values. The caller sets its code, plistTooManyValues.
[[nodiscard]] std::string tooManyValues(std::size_t valuesMaximum);

/// The error for wrong content: domain "propertyList", code 1.
[[nodiscard]] Error contentError(std::string description);

}  // namespace adminhost::plist
