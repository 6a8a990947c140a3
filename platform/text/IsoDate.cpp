#include "platform/text/IsoDate.h"

#include <charconv>
#include <cstdint>
#include <ctime>

#include <fmt/format.h>

namespace adminhost {
std::string isoTextOf(std::chrono::sys_seconds date) {
    using namespace std::chrono;
    // For these years the C library gives the same text, but looks at the zone file even for UTC.
    constexpr sys_days firstDay = year(0) / January / 1;
    constexpr sys_days lastDay = year(9999) / December / 31;
    if (date >= firstDay && date < lastDay + days(1)) {
        const auto day = floor<days>(date);
        const year_month_day calendar(day);
        const hh_mm_ss time(date - day);
        std::string text = "0000-00-00T00:00:00Z";
        const auto put = [&](std::size_t at, long number) {
            text[at] = static_cast<char>('0' + number / 10);
            text[at + 1] = static_cast<char>('0' + number % 10);
        };
        put(0, static_cast<int>(calendar.year()) / 100);
        put(2, static_cast<int>(calendar.year()) % 100);
        put(5, static_cast<long>(static_cast<unsigned>(calendar.month())));
        put(8, static_cast<long>(static_cast<unsigned>(calendar.day())));
        put(11, time.hours().count());
        put(14, time.minutes().count());
        put(17, time.seconds().count());
        return text;
    }
    const std::time_t seconds = date.time_since_epoch().count();
    std::tm parts{};
    if (::gmtime_r(&seconds, &parts) == nullptr) {
        // A year that no int can hold: no calendar text exists.
        return fmt::format("{}", seconds);
    }
    return fmt::format("{:+07}-{:02}-{:02}T{:02}:{:02}:{:02}Z", std::int64_t{parts.tm_year} + 1900, parts.tm_mon + 1,
                       parts.tm_mday, parts.tm_hour, parts.tm_min, parts.tm_sec);
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
