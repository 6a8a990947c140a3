#pragma once

// The JSON form of values, as the daemon's clients send and read it.
//
// A date is {"$date": "2026-01-31T08:00:00Z"} (UTC, whole seconds), data is {"$data": BASE64}, a real that JSON cannot
// write is {"$real": "nan"}, "infinity" or "-infinity". A dictionary's key that begins with "$" carries a second "$".
// Null as a dictionary's value means that the key is absent; inside a list it is rejected, because values have no null
// there. Integers stay integers over the whole signed and unsigned 64-bit range; a number with a fraction or an
// exponent is a real.

#include "platform/framework/Export.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace adminhost {

constexpr std::size_t jsonMaximumDepth = 512;  ///< nested lists and dictionaries
constexpr std::int64_t jsonTooManyValues = 2;  ///< code of the error for more values than the caller allows

/// Parses one JSON text of at most so many values, nulls included. The error is of domain "json", code 1 (or
/// jsonTooManyValues), and its description begins with "line L, column C: " (from 1; columns count characters).
/// Rejected besides broken syntax: invalid UTF-8, a key that occurs twice, nesting beyond
/// the maximum, an integer outside the 64-bit range, null in a list, a key with a single "$" that is not one of the
/// forms above.
[[nodiscard]] ADMINHOST_EXPORT Result<Value> parseJson(std::string_view text, std::size_t valuesMaximum = SIZE_MAX);

/// The JSON text of a value; no line feed at its end. Pretty: one entry a line, two blanks of indentation a level.
/// Bytes of a string that are not UTF-8 are written as U+FFFD.
[[nodiscard]] ADMINHOST_EXPORT std::string jsonOf(const Value& value, bool pretty = false);

}  // namespace adminhost
