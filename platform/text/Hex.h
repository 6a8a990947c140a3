#pragma once

// Hexadecimal digits.

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

namespace adminhost {

constexpr std::string_view lowerHexDigits = "0123456789abcdef";
constexpr std::string_view upperHexDigits = "0123456789ABCDEF";

/// The value of a digit in either case; -1 for any other character.
[[nodiscard]] constexpr int hexValueOf(char digit) noexcept {
    if (digit >= '0' && digit <= '9') {
        return digit - '0';
    }
    const char lower = static_cast<char>(digit | 0x20);
    return lower >= 'a' && lower <= 'f' ? lower - 'a' + 10 : -1;
}

/// Appends the two digits of a byte.
inline void appendHex(std::string& text, std::uint8_t byte, std::string_view digits = lowerHexDigits) {
    text += digits[byte >> 4U];
    text += digits[byte & 0xFU];
}

/// Two lower-case digits a byte.
[[nodiscard]] inline std::string hexOf(std::span<const std::uint8_t> bytes) {
    std::string text;
    text.reserve(bytes.size() * 2);
    for (const std::uint8_t byte : bytes) {
        appendHex(text, byte);
    }
    return text;
}

/// The bytes of pairs of digits in either case; nullopt if it is anything else.
[[nodiscard]] inline std::optional<std::string> textOfHex(std::string_view digits) {
    if (digits.size() % 2 != 0) {
        return std::nullopt;
    }
    std::string bytes;
    bytes.reserve(digits.size() / 2);
    for (std::size_t i = 0; i < digits.size(); i += 2) {
        const int high = hexValueOf(digits[i]);
        const int low = hexValueOf(digits[i + 1]);
        if (high < 0 || low < 0) {
            return std::nullopt;
        }
        bytes += static_cast<char>(high * 16 + low);
    }
    return bytes;
}

}  // namespace adminhost
