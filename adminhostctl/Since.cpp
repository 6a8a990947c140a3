#include "adminhostctl/Since.h"

#include "adminhostctl/Failure.h"
#include "adminhostctl/RequestArguments.h"

#include <charconv>
#include <chrono>
#include <cstdint>
#include <ctime>
#include <string>
#include <system_error>

namespace adminhost::ctl {
namespace {

std::optional<Date> dateAgo(const std::string& text) {
    constexpr std::int64_t longest = 36'500;  // so that no sum overflows
    std::int64_t count = 0;
    const char* const last = text.data() + text.size();
    const auto [end, failure] = std::from_chars(text.data(), last, count);
    if (failure != std::errc() || count < 0 || count > longest) {
        return std::nullopt;
    }
    const Date now = std::chrono::floor<std::chrono::seconds>(std::chrono::system_clock::now());
    const std::string_view unit(end, static_cast<std::size_t>(last - end));
    if (unit == "min") {
        return now - std::chrono::minutes(count);
    }
    if (unit == "h") {
        return now - std::chrono::hours(count);
    }
    return unit == "d" ? std::optional<Date>(now - std::chrono::days(count)) : std::nullopt;
}

std::optional<Date> dateOfDay(const std::string& text) {
    if (text != "today" && text != "yesterday") {
        return std::nullopt;
    }
    const std::time_t now = std::time(nullptr);
    std::tm parts{};
    if (::localtime_r(&now, &parts) == nullptr) {
        return std::nullopt;
    }
    parts.tm_mday -= text == "today" ? 0 : 1;
    parts.tm_hour = parts.tm_min = parts.tm_sec = 0;
    parts.tm_isdst = -1;
    return Date(std::chrono::seconds(std::mktime(&parts)));
}

}  // namespace

std::optional<Date> sinceOf(const Context& context) {
    if (!context.options.has(sinceOption)) {
        return std::nullopt;
    }
    const std::string text = context.options.argumentOf(sinceOption);
    auto date = dateAgo(text);
    date = date ? date : dateOfDay(text);
    date = date ? date : dateOfText(text);
    if (!date || date->time_since_epoch().count() < 0) {
        throw usageError("--since: \"" + text +
                         "\" is neither a date (2026-01-31, 2026-01-31 08:00, today, yesterday) nor a time ago (90min, "
                         "2h, 3d)");
    }
    return *date;
}

}  // namespace adminhost::ctl
