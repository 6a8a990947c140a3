#pragma once

// Values and keys as a TOML file writes them, which is also how changes are shown.

#include "platform/value/Value.h"

#include <optional>
#include <string>
#include <string_view>

namespace adminhost::ctl {

/// A text between double quotes, everything that is no printable character escaped.
[[nodiscard]] std::string tomlText(std::string_view text);
/// A key: bare where it can be.
[[nodiscard]] std::string tomlKey(std::string_view key);
/// Nothing for what a setting's line cannot carry: lists, dictionaries, data, integers above the signed range.
[[nodiscard]] std::optional<std::string> tomlValue(const Value& value);

}  // namespace adminhost::ctl
