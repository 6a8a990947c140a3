#include "platform/text/LocalDate.h"

#include <algorithm>
#include <array>
#include <ctime>

namespace adminhost {
namespace {

using Date = std::chrono::sys_seconds;

constexpr const char* dateFormat = "%Y-%m-%d %H:%M:%S";

/// Seconds east of Greenwich.
long zoneOffsetAt(std::chrono::sys_days midnight) {
    const std::time_t moment = Date(midnight).time_since_epoch().count();
    std::tm parts{};
    return ::localtime_r(&moment, &parts) == nullptr ? 0 : parts.tm_gmtoff;
}

/// Returns true if the zone may have changed since the last call. The daemon keeps running while its machine's zone is
/// changed; checking once a second is enough to notice.
bool zoneMayHaveChanged() {
    static std::optional<std::time_t> last;
    static long lastOffset = 0;
    timespec now{};
    ::clock_gettime(CLOCK_MONOTONIC_COARSE, &now);  // asked for each date of a list, and far cheaper than the exact one
    if (last && ::timezone == lastOffset && now.tv_sec == *last) {
        return false;
    }
    ::tzset();
    last = now.tv_sec;
    lastOffset = ::timezone;
    return true;
}

/// The zone's offset throughout that local day; nullopt near a change of the clocks. Lists hold many dates of few days.
std::optional<long> zoneOffsetOn(std::chrono::sys_days day) {
    struct Known {
        std::chrono::sys_days day{std::chrono::sys_days::max()};
        std::optional<long> offset;
    };
    static std::array<Known, 16> knownDays;
    if (zoneMayHaveChanged()) {
        knownDays = {};
    }
    Known& known = knownDays[static_cast<std::size_t>(day.time_since_epoch().count()) % knownDays.size()];
    if (known.day != day) {
        const long before = zoneOffsetAt(day - std::chrono::days(1));
        const long after = zoneOffsetAt(day + std::chrono::days(2));
        known = {day, before == after ? std::optional(before) : std::nullopt};
    }
    return known.offset;
}

/// A date's text as the C library reads it.
std::optional<std::tm> datePartsOf(std::string_view text) {
    // Fast path for the stored form: the library's parser takes longer than all the rest.
    constexpr std::string_view form = "dddd-dd-dd dd:dd:dd";
    const auto fits = [](char c, char f) { return f == 'd' ? c >= '0' && c <= '9' : c == f; };
    std::tm parts{};
    if (text.size() == form.size() && std::equal(text.begin(), text.end(), form.begin(), fits)) {
        const auto number = [&](std::size_t at) { return (text[at] - '0') * 10 + (text[at + 1] - '0'); };
        parts.tm_year = number(0) * 100 + number(2) - 1900;
        parts.tm_mon = number(5) - 1;
        parts.tm_mday = number(8);
        parts.tm_hour = number(11);
        parts.tm_min = number(14);
        parts.tm_sec = number(17);
        return parts.tm_hour < 24 && parts.tm_min < 60 ? std::optional(parts) : std::nullopt;
    }
    const std::string whole(text);
    const char* end = ::strptime(whole.c_str(), dateFormat, &parts);
    return end == nullptr || end != whole.c_str() + whole.size() ? std::nullopt : std::optional(parts);
}

}  // namespace

std::optional<Date> localDateOf(std::string_view text) {
    std::optional<std::tm> parts = datePartsOf(text);
    if (!parts) {
        return std::nullopt;
    }
    // The C library accepts 30 February and a 61st second and moves them on; a stored date like that is not a date.
    using namespace std::chrono;
    const year_month_day day{year(parts->tm_year + 1900), month(static_cast<unsigned>(parts->tm_mon + 1)),
                             std::chrono::day(static_cast<unsigned>(parts->tm_mday))};
    if (!day.ok() || parts->tm_sec > 59) {
        return std::nullopt;
    }
    // mktime looks at the zone file on every call, which for a long list of dates costs more than all the rest.
    if (const auto offset = zoneOffsetOn(sys_days(day))) {
        return sys_days(day) + hours(parts->tm_hour) + minutes(parts->tm_min) + seconds(parts->tm_sec - *offset);
    }
    parts->tm_isdst = -1;
    return Date(seconds(::mktime(&*parts)));
}

std::string localTextOf(Date date) {
    // localtime_r alone keeps the zone that was read last.
    ::tzset();
    const std::time_t seconds = date.time_since_epoch().count();
    std::tm parts{};
    ::localtime_r(&seconds, &parts);
    char buffer[64];
    return {buffer, std::strftime(buffer, sizeof buffer, dateFormat, &parts)};
}

}  // namespace adminhost
