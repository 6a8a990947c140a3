#include "platform/text/Base64Text.h"

#include <algorithm>
#include <array>
#include <cstddef>

#include <openssl/evp.h>

namespace adminhost {
namespace {

/// The library counts in int: longer input is coded in pieces, a whole number of groups each.
constexpr std::size_t pieceBytes = std::size_t{3} << 20U;
constexpr std::size_t pieceCharacters = pieceBytes / 3 * 4;

unsigned char* bytesOf(std::string& text) noexcept {
    return reinterpret_cast<unsigned char*>(text.data());
}

}  // namespace

std::string base64TextOf(std::span<const std::uint8_t> bytes) {
    const std::size_t length = (bytes.size() + 2) / 3 * 4;
    std::string text(length + 1, '\0');  // the library ends its text with a NUL
    unsigned char* out = bytesOf(text);
    while (!bytes.empty()) {
        const auto piece = bytes.first(std::min(bytes.size(), pieceBytes));
        out += ::EVP_EncodeBlock(out, piece.data(), static_cast<int>(piece.size()));
        bytes = bytes.subspan(piece.size());
    }
    text.resize(length);
    return text;
}

std::optional<std::vector<std::uint8_t>> bytesOfBase64Text(std::string_view text) {
    if (text.size() % 4 != 0) {
        return std::nullopt;
    }
    const std::size_t padding = text.ends_with("==") ? 2 : text.ends_with('=') ? 1 : 0;
    // The library reads a pad inside the text as "A".
    if (text.substr(0, text.size() - padding).find('=') != std::string_view::npos) {
        return std::nullopt;
    }
    std::vector<std::uint8_t> bytes(text.size() / 4 * 3);
    std::uint8_t* out = bytes.data();
    for (std::string_view left = text; !left.empty();) {
        const std::string_view piece = left.substr(0, pieceCharacters);
        const int count = ::EVP_DecodeBlock(out, reinterpret_cast<const unsigned char*>(piece.data()),
                                            static_cast<int>(piece.size()));
        // It skips white space around the text: then there are fewer bytes.
        if (count < 0 || static_cast<std::size_t>(count) != piece.size() / 4 * 3) {
            return std::nullopt;
        }
        out += count;
        left.remove_prefix(piece.size());
    }
    bytes.resize(bytes.size() - padding);
    // Nor does it look at the bits beyond the last byte.
    const std::size_t tail = (3 - padding) % 3;
    if (tail != 0 && base64TextOf(std::span(bytes).last(tail)) != text.substr(text.size() - 4)) {
        return std::nullopt;
    }
    return bytes;
}

}  // namespace adminhost
