#include "platform/log/Log.h"

#include <cstdint>

#include <fmt/format.h>
#include <unicode/utf8.h>

namespace adminhost {
namespace {

constexpr std::string_view indentation = "    ";

/// Appends one character as it is logged. A negative code is a byte that is not part of well-formed UTF-8.
void append(std::string& text, std::string_view bytes, UChar32 code) {
    if (code == '\n') {
        text += bytes;
        text += indentation;
    } else if (code == '\t') {
        text += "\\t";
    } else if (code == '\r') {
        text += "\\r";
    } else if (code < 0x20 || code == 0x7f) {
        for (const char byte : bytes) {
            text += fmt::format("\\x{:02x}", static_cast<unsigned char>(byte));
        }
    } else if (code >= 0x80 && code < 0xa0) {
        text += fmt::format("\\u{:04x}", static_cast<unsigned>(code));
    } else {
        text += bytes;
    }
}

}  // namespace

std::string logTextOf(std::string_view event) {
    event = event.substr(0, event.find_last_not_of('\n') + 1);
    std::string text;
    text.reserve(event.size() + 1);
    const auto* bytes = reinterpret_cast<const std::uint8_t*>(event.data());
    std::size_t at = 0;
    while (at < event.size()) {
        const std::size_t begin = at;
        UChar32 code = 0;
        U8_NEXT(bytes, at, event.size(), code);
        append(text, event.substr(begin, at - begin), code);
    }
    return text;
}

}  // namespace adminhost
