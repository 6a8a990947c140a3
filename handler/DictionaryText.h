#pragma once

#include "platform/value/Value.h"

#include <optional>
#include <string>
#include <string_view>

namespace lumio {

/// The text under the key; nullopt if there is none. A value of another type counts as missing.
[[nodiscard]] inline std::optional<std::string> textIn(const adminhost::Dictionary& dictionary, std::string_view key) {
    const std::string* text = dictionary.get(key).string();
    return text == nullptr ? std::nullopt : std::optional(*text);
}

}  // namespace lumio
