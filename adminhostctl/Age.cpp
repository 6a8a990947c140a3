#include "adminhostctl/Age.h"

#include "adminhostctl/Reading.h"

#include <array>
#include <ctime>
#include <utility>

#include <fmt/format.h>

namespace adminhost::ctl {
namespace {

/// "2 minutes": the largest unit of which there is at least one.
std::string durationText(std::chrono::seconds duration) {
    constexpr std::array<std::pair<long, const char*>, 5> units{
        {{31'557'600, "year"}, {86'400, "day"}, {3'600, "hour"}, {60, "minute"}, {1, "second"}}};
    for (const auto& [seconds, name] : units) {
        if (const long count = duration.count() / seconds; count > 0) {
            return fmt::format("{} {}{}", count, name, count == 1 ? "" : "s");
        }
    }
    return "0 seconds";
}

std::tm localTime(std::time_t seconds) {
    std::tm parts{};
    (void)::localtime_r(&seconds, &parts);  // a year that does not fit leaves the parts at 0
    return parts;
}

}  // namespace

std::string dateWithAge(Date date, std::chrono::system_clock::time_point now) {
    const auto age = std::chrono::floor<std::chrono::seconds>(now) - date;
    const std::tm then = localTime(date.time_since_epoch().count());
    const std::tm today = localTime(std::chrono::system_clock::to_time_t(now));
    const bool isToday = then.tm_year == today.tm_year && then.tm_yday == today.tm_yday;
    const std::string clock = isToday ? fmt::format("{:02}:{:02}:{:02}", then.tm_hour, then.tm_min, then.tm_sec)
                                      : dateText(date) + fmt::format(":{:02}", then.tm_sec);
    return age.count() < 0 ? "in " + durationText(-age) + ", " + clock : durationText(age) + " ago, " + clock;
}

}  // namespace adminhost::ctl
