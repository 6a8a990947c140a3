#pragma once

// Formats values and keys for a TOML file. Changes are shown in the same form.

#include "platform/value/Value.h"

#include <optional>
#include <string>
#include <string_view>

namespace adminhost::ctl {

/// The text between double quotes, with every character that is not printable escaped.
[[nodiscard]] std::string tomlText(std::string_view text);
/// The key, without quotes if possible.
[[nodiscard]] std::string tomlKey(std::string_view key);
/// nullopt for values that the line of a setting cannot carry: lists, dictionaries, data, integers above the signed
/// range.
[[nodiscard]] std::optional<std::string> tomlValue(const Value& value);

}  // namespace adminhost::ctl
