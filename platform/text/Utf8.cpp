#include "platform/text/Utf8.h"

#include <cstdint>
#include <cstring>

#include <unicode/utf16.h>
#include <unicode/utf8.h>

// Of ICU only the macros, which need no library: programs that load no plug-in go without it.

namespace adminhost {

Utf8Character firstCharacterOf(std::string_view text) noexcept {
    constexpr char32_t replacement = 0xFFFD;
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(text.data());
    std::size_t size = 0;
    UChar32 code = 0;
    U8_NEXT(bytes, size, text.size(), code);
    return code < 0 ? Utf8Character{replacement, 1, false} : Utf8Character{static_cast<char32_t>(code), size, true};
}

bool isUtf8(std::string_view text) noexcept {
    while (!text.empty()) {
        // Most texts are ASCII alone: eight characters at a time.
        std::uint64_t eight = 0;
        if (text.size() >= sizeof eight) {
            std::memcpy(&eight, text.data(), sizeof eight);
            if ((eight & 0x8080808080808080U) == 0) {
                text.remove_prefix(sizeof eight);
                continue;
            }
        }
        if (static_cast<unsigned char>(text.front()) < 0x80) {
            text.remove_prefix(1);
            continue;
        }
        const Utf8Character character = firstCharacterOf(text);
        if (!character.wellFormed) {
            return false;
        }
        text.remove_prefix(character.size);
    }
    return true;
}

std::string utf8Of(std::string_view bytes) {
    std::string text;
    text.reserve(bytes.size());
    while (!bytes.empty()) {
        const Utf8Character character = firstCharacterOf(bytes);
        if (character.wellFormed) {
            text += bytes.substr(0, character.size);
        } else {
            appendUtf8(text, character.code);
        }
        bytes.remove_prefix(character.size);
    }
    return text;
}

void appendUtf8(std::string& text, char32_t code) {
    std::uint8_t bytes[U8_MAX_LENGTH];
    std::size_t size = 0;
    U8_APPEND_UNSAFE(bytes, size, code);
    text.append(reinterpret_cast<const char*>(bytes), size);
}

FromUtf16 utf8OfUtf16(std::string_view bytes, bool bigEndian) {
    const auto unitAt = [&](std::size_t at) -> char32_t {
        const auto first = static_cast<unsigned char>(bytes[at]);
        const auto second = static_cast<unsigned char>(bytes[at + 1]);
        return bigEndian ? char32_t{first} << 8U | second : char32_t{second} << 8U | first;
    };
    FromUtf16 result;
    result.text.reserve(bytes.size() / 2);
    while (result.end + 2 <= bytes.size()) {
        char32_t code = unitAt(result.end);
        std::size_t length = 2;
        if (U16_IS_SURROGATE(code)) {
            const char32_t trail = result.end + 4 <= bytes.size() ? unitAt(result.end + 2) : 0;
            if (!U16_IS_LEAD(code) || !U16_IS_TRAIL(trail)) {
                break;
            }
            code = static_cast<char32_t>(U16_GET_SUPPLEMENTARY(code, trail));
            length = 4;
        }
        appendUtf8(result.text, code);
        result.end += length;
    }
    return result;
}

}  // namespace adminhost
