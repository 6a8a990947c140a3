#include "platform/plist/Formats.h"

#include <array>
#include <cstdint>
#include <utility>

#include <fmt/format.h>

namespace adminhost::plist {
namespace {

constexpr std::string_view digits = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
constexpr std::uint8_t noDigit = 255;
constexpr std::uint8_t whiteSpace = 254;

constexpr std::array<std::uint8_t, 256> digitValues = [] {
    std::array<std::uint8_t, 256> values{};
    values.fill(noDigit);
    for (std::size_t i = 0; i < digits.size(); ++i) {
        values[static_cast<unsigned char>(digits[i])] = static_cast<std::uint8_t>(i);
    }
    for (const char c : {' ', '\t', '\n', '\r'}) {
        values[static_cast<unsigned char>(c)] = whiteSpace;
    }
    return values;
}();

void appendUtf8(std::string& text, std::uint32_t point) {
    const auto push = [&](std::uint32_t byte) { text += static_cast<char>(byte); };
    if (point < 0x80) {
        push(point);
    } else if (point < 0x800) {
        push(0xC0 | point >> 6U);
        push(0x80 | (point & 0x3FU));
    } else if (point < 0x10000) {
        push(0xE0 | point >> 12U);
        push(0x80 | (point >> 6U & 0x3FU));
        push(0x80 | (point & 0x3FU));
    } else {
        push(0xF0 | point >> 18U);
        push(0x80 | (point >> 12U & 0x3FU));
        push(0x80 | (point >> 6U & 0x3FU));
        push(0x80 | (point & 0x3FU));
    }
}

}  // namespace

Error contentError(std::string description) {
    return Error{"propertyList", 1, std::move(description)};
}

std::string tooManyValues(std::size_t valuesMaximum) {
    return fmt::format("there are more than {} values", valuesMaximum);
}

FromUtf16 utf8OfUtf16(std::string_view bytes, bool bigEndian) {
    const auto unitAt = [&](std::size_t at) -> std::uint32_t {
        const auto first = static_cast<unsigned char>(bytes[at]);
        const auto second = static_cast<unsigned char>(bytes[at + 1]);
        return bigEndian ? first << 8U | second : second << 8U | first;
    };
    FromUtf16 result;
    result.text.reserve(bytes.size() / 2);
    while (result.end + 2 <= bytes.size()) {
        std::uint32_t point = unitAt(result.end);
        std::size_t length = 2;
        if (point >= 0xD800 && point <= 0xDFFF) {
            const std::uint32_t low = result.end + 4 <= bytes.size() ? unitAt(result.end + 2) : 0;
            if (point >= 0xDC00 || low < 0xDC00 || low > 0xDFFF) {
                break;
            }
            point = 0x10000 + ((point - 0xD800) << 10U) + (low - 0xDC00);
            length = 4;
        }
        appendUtf8(result.text, point);
        result.end += length;
    }
    return result;
}

std::string base64Of(const Data& data) {
    std::string text;
    text.reserve((data.size() + 2) / 3 * 4);
    for (std::size_t i = 0; i < data.size(); i += 3) {
        const std::size_t count = data.size() - i < 3 ? data.size() - i : 3;
        const std::uint32_t group = static_cast<std::uint32_t>(data[i]) << 16U |
                                    (count > 1 ? static_cast<std::uint32_t>(data[i + 1]) << 8U : 0U) |
                                    (count > 2 ? static_cast<std::uint32_t>(data[i + 2]) : 0U);
        text += digits[group >> 18U];
        text += digits[group >> 12U & 0x3FU];
        text += count > 1 ? digits[group >> 6U & 0x3FU] : '=';
        text += count > 2 ? digits[group & 0x3FU] : '=';
    }
    return text;
}

std::optional<Data> dataOfBase64(std::string_view text) {
    Data data;
    data.reserve(text.size() / 4 * 3);
    std::uint32_t group = 0;
    unsigned inGroup = 0;
    unsigned padding = 0;
    for (const char c : text) {
        const std::uint8_t value = digitValues[static_cast<unsigned char>(c)];
        if (value == whiteSpace) {
            continue;
        }
        if (c == '=') {
            if (inGroup + padding < 2 || inGroup + padding >= 4) {
                return std::nullopt;
            }
            ++padding;
            continue;
        }
        if (value == noDigit || padding > 0) {
            return std::nullopt;
        }
        group = group << 6U | value;
        if (++inGroup == 4) {
            data.push_back(static_cast<std::uint8_t>(group >> 16U));
            data.push_back(static_cast<std::uint8_t>(group >> 8U));
            data.push_back(static_cast<std::uint8_t>(group));
            group = 0;
            inGroup = 0;
        }
    }
    if (inGroup == 0 && padding == 0) {
        return data;
    }
    const unsigned unusedBits = inGroup == 2 ? 4 : 2;
    if (inGroup + padding != 4 || (group & ((1U << unusedBits) - 1U)) != 0) {
        return std::nullopt;
    }
    group >>= unusedBits;
    if (inGroup == 3) {
        data.push_back(static_cast<std::uint8_t>(group >> 8U));
    }
    data.push_back(static_cast<std::uint8_t>(group));
    return data;
}

bool isWritableDate(Date date) noexcept {
    using namespace std::chrono;
    constexpr Date first = sys_days{year{0} / January / 1};
    constexpr Date end = sys_days{year{10000} / January / 1};
    return date >= first && date < end;
}

}  // namespace adminhost::plist
