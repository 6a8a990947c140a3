#include "platform/directory/CarriedText.h"

#include "platform/text/Utf8.h"

namespace adminhost {
namespace {

/// Returns true if XML can carry the well-formed UTF-8 character that begins at the position.
bool isCarried(std::string_view text, std::size_t at) noexcept {
    const auto byte = static_cast<unsigned char>(text[at]);
    if (byte < 0x20) {
        return byte == '\t' || byte == '\n' || byte == '\r';
    }
    const std::string_view character = text.substr(at, 3);
    return character != "\xEF\xBF\xBE" && character != "\xEF\xBF\xBF";  // U+FFFE, U+FFFF
}

}  // namespace

bool isCarriedText(std::string_view text) noexcept {
    if (!isUtf8(text)) {
        return false;
    }
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (!isCarried(text, i)) {
            return false;
        }
    }
    return true;
}

std::string carriedTextOf(std::string_view bytes) {
    if (isCarriedText(bytes)) {
        return std::string(bytes);
    }
    std::string text = utf8Of(bytes);
    for (std::size_t i = 0; i < text.size(); ++i) {
        if (!isCarried(text, i)) {
            text.replace(i, static_cast<unsigned char>(text[i]) < 0x20 ? 1 : 3, "\xEF\xBF\xBD");
        }
    }
    return text;
}

}  // namespace adminhost
