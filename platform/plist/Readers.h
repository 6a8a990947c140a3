#pragma once

// The readers of a property list's forms, and the errors that they share. For this room's sources only.

#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <string>
#include <string_view>

namespace adminhost::plist {

/// Each parses a whole list of its form. Returns nullopt, with the error, if it is not one or has more values.
[[nodiscard]] Result<Value> parseXml(std::string_view bytes, std::size_t valuesMaximum);
[[nodiscard]] Result<Value> parseBinary(std::string_view bytes, std::size_t valuesMaximum);

/// The text of the error for more values. The caller sets its code, plistTooManyValues.
[[nodiscard]] std::string tooManyValues(std::size_t valuesMaximum);

/// The error for wrong content: domain "propertyList", code 1.
[[nodiscard]] Error contentError(std::string description);

}  // namespace adminhost::plist
