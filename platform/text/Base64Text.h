#pragma once

// Base64 (RFC 4648, section 4) in one line: the form of data in property lists and JSON. The service's own form, with
// its lines and lenient reading, is in codec/.

#include "platform/framework/Export.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

/// With padding, without line feeds.
[[nodiscard]] ADMINHOST_EXPORT std::string base64TextOf(std::span<const std::uint8_t> bytes);

/// The bytes whose base64TextOf() is exactly this text; nullopt for any other text.
[[nodiscard]] ADMINHOST_EXPORT std::optional<std::vector<std::uint8_t>> bytesOfBase64Text(std::string_view text);

}  // namespace adminhost
