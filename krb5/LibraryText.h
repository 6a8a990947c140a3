#pragma once

// Texts that cross to and from the Kerberos library.

#include "krb5/Handle.h"
#include "platform/text/Utf8.h"

#include <optional>
#include <string>
#include <string_view>

namespace lumio {

/// The library's text if it is UTF-8; nullopt if it is null or not UTF-8.
[[nodiscard]] inline std::optional<std::string> utf8TextOf(const char* text) {
    if (text == nullptr || !adminhost::isUtf8(text)) {
        return std::nullopt;
    }
    return text;
}

/// Returns true if the library would read only the beginning of the text.
[[nodiscard]] inline bool hasNul(std::string_view text) noexcept {
    return text.find('\0') != std::string_view::npos;
}

}  // namespace lumio
