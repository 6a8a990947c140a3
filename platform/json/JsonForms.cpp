#include "platform/json/JsonForms.h"

#include <array>
#include <charconv>
#include <cstdint>
#include <ctime>

#include <fmt/format.h>

namespace adminhost::json {
namespace {

constexpr std::string_view alphabet = "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";

constexpr std::array<std::int8_t, 256> makeReverse() {
    std::array<std::int8_t, 256> reverse{};
    reverse.fill(-1);
    for (std::size_t i = 0; i < alphabet.size(); ++i) {
        reverse[static_cast<unsigned char>(alphabet[i])] = static_cast<std::int8_t>(i);
    }
    return reverse;
}
constexpr std::array<std::int8_t, 256> reverseAlphabet = makeReverse();

}  // namespace

std::string dateText(Date date) {
    const std::time_t seconds = date.time_since_epoch().count();
    std::tm parts{};
    if (::gmtime_r(&seconds, &parts) == nullptr) {
        // A year that no int can hold: no calendar text exists.
        return fmt::format("{}", seconds);
    }
    const std::int64_t year = std::int64_t{parts.tm_year} + 1900;
    const bool common = year >= 0 && year <= 9999;
    std::string text = common ? "0000-00-00T00:00:00Z" : fmt::format("{:+07}-00-00T00:00:00Z", year);
    // Long lists hold many dates, and the library's formatting takes longer than all the rest of writing them.
    const auto put = [&](std::size_t fromEnd, int number) {
        text[text.size() - fromEnd] = static_cast<char>('0' + number / 10);
        text[text.size() - fromEnd + 1] = static_cast<char>('0' + number % 10);
    };
    if (common) {
        put(20, static_cast<int>(year / 100));
        put(18, static_cast<int>(year % 100));
    }
    put(15, parts.tm_mon + 1);
    put(12, parts.tm_mday);
    put(9, parts.tm_hour);
    put(6, parts.tm_min);
    put(3, parts.tm_sec);
    return text;
}

std::optional<Date> dateOf(std::string_view text) {
    // Everything after the year has a fixed width: "-01-31T08:00:00Z".
    constexpr std::size_t tail = 16;
    if (text.size() < 4 + tail || text.size() > 11 + tail) {
        return std::nullopt;
    }
    const std::size_t yearWidth = text.size() - tail;
    bool good = true;
    const auto number = [&](std::size_t at, std::size_t width) {
        int value = 0;
        const char* begin = text.data() + at + (at == 0 && text.front() == '+' ? 1 : 0);
        const char* end = text.data() + at + width;
        good = good && std::from_chars(begin, end, value).ptr == end;
        return value;
    };
    std::tm parts{};
    const int year = number(0, yearWidth);
    if (year < INT32_MIN + 1900) {
        return std::nullopt;
    }
    parts.tm_year = year - 1900;
    parts.tm_mon = number(yearWidth + 1, 2) - 1;
    parts.tm_mday = number(yearWidth + 4, 2);
    parts.tm_hour = number(yearWidth + 7, 2);
    parts.tm_min = number(yearWidth + 10, 2);
    parts.tm_sec = number(yearWidth + 13, 2);
    if (!good) {
        return std::nullopt;
    }
    // Written back, because the C library moves 30 February on to March instead of refusing it.
    const Date date{std::chrono::seconds(::timegm(&parts))};
    return dateText(date) == text ? std::optional(date) : std::nullopt;
}

std::string base64Text(const Data& data) {
    std::string text;
    text.reserve((data.size() + 2) / 3 * 4);
    for (std::size_t i = 0; i < data.size(); i += 3) {
        const std::size_t left = data.size() - i;
        const std::uint32_t group = (std::uint32_t{data[i]} << 16U) |
                                    (left > 1 ? std::uint32_t{data[i + 1]} << 8U : 0U) |
                                    (left > 2 ? std::uint32_t{data[i + 2]} : 0U);
        text += alphabet[group >> 18U];
        text += alphabet[(group >> 12U) & 63U];
        text += left > 1 ? alphabet[(group >> 6U) & 63U] : '=';
        text += left > 2 ? alphabet[group & 63U] : '=';
    }
    return text;
}

std::optional<Data> base64Data(std::string_view text) {
    if (text.size() % 4 != 0) {
        return std::nullopt;
    }
    const std::size_t padding = text.ends_with("==") ? 2 : text.ends_with('=') ? 1 : 0;
    Data data;
    data.reserve(text.size() / 4 * 3);
    std::uint32_t bits = 0;
    unsigned count = 0;
    for (const char c : text.substr(0, text.size() - padding)) {
        const std::int8_t digit = reverseAlphabet[static_cast<unsigned char>(c)];
        if (digit < 0) {
            return std::nullopt;
        }
        bits = (bits << 6U) | static_cast<std::uint32_t>(digit);
        count += 6;
        if (count >= 8) {
            count -= 8;
            data.push_back(static_cast<std::uint8_t>(bits >> count));
            bits &= (1U << count) - 1;
        }
    }
    return bits == 0 ? std::optional(std::move(data)) : std::nullopt;
}

}  // namespace adminhost::json
