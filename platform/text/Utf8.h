#pragma once

// UTF-8 as RFC 3629 defines it: no overlong forms, no surrogates, nothing above U+10FFFF.

#include "platform/framework/Export.h"

#include <cstddef>
#include <string>
#include <string_view>

namespace adminhost {

/// Returns true if the whole text is well-formed.
[[nodiscard]] ADMINHOST_EXPORT bool isUtf8(std::string_view text) noexcept;

/// The text with every byte that is not part of well-formed UTF-8 replaced by U+FFFD.
[[nodiscard]] ADMINHOST_EXPORT std::string utf8Of(std::string_view bytes);

struct ADMINHOST_EXPORT Utf8Character {
    char32_t code = 0;
    std::size_t size = 0;     ///< bytes
    bool wellFormed = false;  ///< if not: one byte, with the code U+FFFD
};

/// The first character of a text that is not empty.
[[nodiscard]] ADMINHOST_EXPORT Utf8Character firstCharacterOf(std::string_view text) noexcept;

/// Returns true for a byte that continues a character.
[[nodiscard]] constexpr bool continuesCharacter(char byte) noexcept {
    return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U;
}

/// Appends a character: a code up to U+10FFFF that is not a surrogate.
ADMINHOST_EXPORT void appendUtf8(std::string& text, char32_t code);

struct ADMINHOST_EXPORT FromUtf16 {
    std::string text;
    std::size_t end = 0;  ///< bytes that were read
};
/// UTF-16 without a byte-order mark as UTF-8. Stops where it is not well-formed (an unpaired surrogate, half a unit):
/// then `end` is less than the size.
[[nodiscard]] ADMINHOST_EXPORT FromUtf16 utf8OfUtf16(std::string_view bytes, bool bigEndian);

}  // namespace adminhost
