#pragma once

// Texts of a directory that a property list can carry: well-formed UTF-8 without the characters that XML forbids.

#include <string>
#include <string_view>

namespace adminhost {

[[nodiscard]] bool isCarriedText(std::string_view text) noexcept;

/// For texts that people read: what a property list cannot carry becomes U+FFFD. Not for names, because a repaired name
/// would name another account.
[[nodiscard]] std::string carriedTextOf(std::string_view bytes);

}  // namespace adminhost
