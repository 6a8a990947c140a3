#include "platform/text/IsoDate.h"

#include <charconv>
#include <cstdint>
#include <ctime>

#include <fmt/format.h>

namespace adminhost {
std::string isoTextOf(std::chrono::sys_seconds date) {
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

std::optional<std::chrono::sys_seconds> isoDateOf(std::string_view text) {
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
    const std::chrono::sys_seconds date{std::chrono::seconds(::timegm(&parts))};
    return isoTextOf(date) == text ? std::optional(date) : std::nullopt;
}

bool hasFourDigitYear(std::chrono::sys_seconds date) noexcept {
    using namespace std::chrono;
    constexpr sys_seconds first = sys_days{year{0} / January / 1};
    constexpr sys_seconds end = sys_days{year{10000} / January / 1};
    return date >= first && date < end;
}

}  // namespace adminhost
