#pragma once

// The compact binary form of values, for two processes of one build on one machine. It is not a file format: it may
// change with any release.

#include "platform/framework/Export.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

/// Nested arrays and dictionaries that decodeValue() follows: more than any reader of ours lets in.
constexpr std::size_t codecMaximumDepth = 1024;

/// Appends the value's bytes.
ADMINHOST_EXPORT void encodeValue(const Value& value, std::string& bytes);

/// The value that exactly these bytes encode. Returns nullopt if they are cut off, continue after the value, are nested
/// too deep, or contain something that a value cannot have (a null or repeated key in a dictionary). Never reserves
/// more memory than the given bytes justify.
[[nodiscard]] ADMINHOST_EXPORT std::optional<Value> decodeValue(std::string_view bytes);

}  // namespace adminhost
