#pragma once

// The compact binary form of values, for two processes of one build on one machine. It is no file format: it may
// change with any release.

#include "platform/value/Value.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

/// Nested arrays and dictionaries that decodeValue() follows: more than any reader of ours lets in.
constexpr std::size_t codecMaximumDepth = 1024;

/// Appends the value's bytes.
void encodeValue(const Value& value, std::string& bytes);

/// The value that exactly these bytes stand for. Nothing when they are cut off, hold anything more, are nested too
/// deep, or hold what no value does (a null or repeated key in a dictionary). Never reserves more memory than the bytes
/// at hand justify.
[[nodiscard]] std::optional<Value> decodeValue(std::string_view bytes);

}  // namespace adminhost
