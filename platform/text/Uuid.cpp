#include "platform/text/Uuid.h"

#include "platform/text/Hex.h"

#include <stdexcept>

#include <sys/random.h>

namespace adminhost {
namespace {

constexpr std::size_t textLength = 36;

constexpr bool hyphenAt(std::size_t position) noexcept {
    return position == 8 || position == 13 || position == 18 || position == 23;
}

}  // namespace

std::optional<Uuid> uuidOf(std::string_view text) noexcept {
    if (text.size() != textLength) {
        return std::nullopt;
    }
    Uuid uuid{};
    std::size_t digits = 0;
    for (std::size_t i = 0; i < textLength; ++i) {
        if (hyphenAt(i)) {
            if (text[i] != '-') {
                return std::nullopt;
            }
            continue;
        }
        const int digit = hexValueOf(text[i]);
        if (digit < 0) {
            return std::nullopt;
        }
        std::uint8_t& byte = uuid[digits++ / 2];
        byte = static_cast<std::uint8_t>(byte << 4U | static_cast<unsigned>(digit));
    }
    return uuid;
}

std::string textOf(const Uuid& uuid) {
    std::string text;
    text.reserve(textLength);
    for (const std::uint8_t byte : uuid) {
        if (hyphenAt(text.size())) {
            text += '-';
        }
        appendHex(text, byte, upperHexDigits);
    }
    return text;
}

Uuid randomUuid() {
    Uuid uuid{};
    if (::getrandom(uuid.data(), uuid.size(), 0) != static_cast<ssize_t>(uuid.size())) {
        throw std::runtime_error("the system's random source failed");
    }
    uuid[6] = static_cast<std::uint8_t>((uuid[6] & 0x0FU) | 0x40U);  // version 4
    uuid[8] = static_cast<std::uint8_t>((uuid[8] & 0x3FU) | 0x80U);  // variant of RFC 4122
    return uuid;
}

}  // namespace adminhost
