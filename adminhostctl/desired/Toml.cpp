#include "adminhostctl/desired/Toml.h"

#include "adminhostctl/Width.h"
#include "platform/text/IsoDate.h"
#include "platform/text/Utf8.h"

#include <algorithm>
#include <cmath>

#include <fmt/format.h>

namespace adminhost::ctl {

std::string tomlText(std::string_view text) {
    std::string quoted = "\"";
    for (std::size_t at = 0; at < text.size();) {
        const auto byte = static_cast<unsigned char>(text[at]);
        if (byte == '"' || byte == '\\') {
            quoted += {'\\', text[at]};
        } else if (byte == '\n') {
            quoted += "\\n";
        } else if (byte == '\t') {
            quoted += "\\t";
        } else if (byte < 0x20 || byte == 0x7F) {
            quoted += fmt::format("\\u{:04X}", byte);
        } else if (byte >= 0xC0) {
            // Characters that a terminal would act on (C1 controls, changes of direction) are written by number.
            const Utf8Character first = firstCharacterOf(text.substr(at));
            const std::string_view character = text.substr(at, first.size);
            if (shown(character) == character) {
                quoted += character;
            } else {
                quoted += fmt::format("\\U{:08X}", static_cast<std::uint32_t>(first.code));
            }
            at += first.size - 1;
        } else {
            quoted += text[at];
        }
        ++at;
    }
    return quoted + '"';
}

std::string tomlKey(std::string_view key) {
    const bool bare = !key.empty() && std::all_of(key.begin(), key.end(), [](char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_' || c == '-';
    });
    return bare ? std::string(key) : tomlText(key);
}

std::optional<std::string> tomlValue(const Value& value) {
    if (const std::string* text = value.string()) {
        return tomlText(*text);
    }
    if (const auto boolean = value.boolean()) {
        return *boolean ? "true" : "false";
    }
    if (const auto integer = value.integer()) {
        return fmt::format("{}", *integer);
    }
    if (const auto real = value.real()) {
        const std::string text = fmt::format("{}", *real);
        return std::isfinite(*real) && text.find_first_of(".e") == std::string::npos ? text + ".0" : text;
    }
    if (const auto date = value.date()) {
        return isoTextOf(*date);
    }
    return std::nullopt;
}

}  // namespace adminhost::ctl
