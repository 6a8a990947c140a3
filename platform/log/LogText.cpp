#include "platform/log/Log.h"
#include "platform/text/Utf8.h"

#include <algorithm>

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr std::string_view indentation = "    ";

void append(std::string& text, std::string_view bytes, const Utf8Character& character) {
    const char32_t code = character.code;
    if (code == '\n') {
        text += bytes;
        text += indentation;
    } else if (code == '\t') {
        text += "\\t";
    } else if (code == '\r') {
        text += "\\r";
    } else if (!character.wellFormed || code < 0x20 || code == 0x7f) {
        text += fmt::format("\\x{:02x}", static_cast<unsigned char>(bytes.front()));
    } else if (code >= 0x80 && code < 0xa0) {
        text += fmt::format("\\u{:04x}", static_cast<unsigned>(code));
    } else {
        text += bytes;
    }
}

}  // namespace

std::string logTextOf(std::string_view event) {
    event = event.substr(0, event.find_last_not_of('\n') + 1);
    if (std::all_of(event.begin(), event.end(), [](char c) { return c >= 0x20 && c < 0x7f; })) {
        return std::string(event);  // almost always
    }
    std::string text;
    text.reserve(event.size() + 1);
    while (!event.empty()) {
        const Utf8Character character = firstCharacterOf(event);
        append(text, event.substr(0, character.size), character);
        event.remove_prefix(character.size);
    }
    return text;
}

}  // namespace adminhost
