#include "platform/value/Text.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cstdint>
#include <cstring>
#include <ctime>

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr std::string_view nullText = "(null)";
constexpr std::string_view replacement = "\xEF\xBF\xBD";  // U+FFFD
constexpr const char* dateFormat = "%Y-%m-%d %H:%M:%S";

void appendText(std::string& text, const Value& value, std::size_t indent);

void appendArray(std::string& text, const Array& array, std::size_t indent) {
    text += "(\n";
    for (std::size_t i = 0; i < array.size(); ++i) {
        text.append(indent + 4, ' ');
        appendText(text, array[i], indent + 4);
        text += i + 1 < array.size() ? ",\n" : "\n";
    }
    text.append(indent, ' ');
    text += ')';
}

void appendDictionary(std::string& text, const Dictionary& dictionary, std::size_t indent) {
    text += "{\n";
    for (const DictionaryEntry& entry : dictionary) {
        text.append(indent + 4, ' ');
        text += entry.key;
        text += " = ";
        appendText(text, entry.value, indent + 4);
        text += ";\n";
    }
    text.append(indent, ' ');
    text += '}';
}

void appendText(std::string& text, const Value& value, std::size_t indent) {
    switch (value.type()) {
        case Value::Type::null:
            text += nullText;
            break;
        case Value::Type::boolean:
            text += *value.boolean() ? '1' : '0';
            break;
        case Value::Type::integer:
            if (const auto number = value.integer()) {
                text += fmt::format("{}", *number);
            } else {
                text += fmt::format("{}", *value.unsignedInteger());
            }
            break;
        case Value::Type::real: {
            char buffer[512];  // the longest texts, of the smallest numbers, have about 330 characters
            const auto end = std::to_chars(buffer, buffer + sizeof buffer, *value.real(), std::chars_format::fixed).ptr;
            text.append(buffer, end);
            break;
        }
        case Value::Type::string:
            text += *value.string();
            break;
        case Value::Type::date: {
            const std::time_t seconds = value.date()->time_since_epoch().count();
            std::tm parts{};
            ::gmtime_r(&seconds, &parts);
            char buffer[64];
            text.append(buffer, std::strftime(buffer, sizeof buffer, "%Y-%m-%d %H:%M:%S +0000", &parts));
            break;
        }
        case Value::Type::data:
            text += '<';
            for (const std::uint8_t byte : *value.data()) {
                text += fmt::format("{:02x}", byte);
            }
            text += '>';
            break;
        case Value::Type::array:
            appendArray(text, *value.array(), indent);
            break;
        case Value::Type::dictionary:
            appendDictionary(text, *value.dictionary(), indent);
            break;
    }
}

bool isBlank(char c) noexcept {
    return c == ' ' || c == '\t';
}

bool truthOf(const Value& value, bool skipZeros) noexcept {
    if (const auto boolean = value.boolean()) {
        return *boolean;
    }
    if (value.isInteger()) {
        return value.integer() != 0;
    }
    if (const auto real = value.real()) {
        return *real != 0;
    }
    const std::string* text = value.string();
    if (text == nullptr) {
        return false;
    }
    std::size_t at = 0;
    while (at < text->size() && isBlank((*text)[at])) {
        ++at;
    }
    while (skipZeros && at < text->size() && (*text)[at] == '0') {
        ++at;
    }
    return at < text->size() && std::strchr("YyTt123456789", (*text)[at]) != nullptr && (*text)[at] != '\0';
}

/// Seconds east of Greenwich.
long zoneOffsetAt(std::chrono::sys_days midnight) {
    const std::time_t moment = Date(midnight).time_since_epoch().count();
    std::tm parts{};
    return ::localtime_r(&moment, &parts) == nullptr ? 0 : parts.tm_gmtoff;
}

/// Whether the zone may be another one than when this was last asked. A daemon lives on while its machine's zone is
/// changed; once a second is soon enough to notice.
bool zoneMayHaveChanged() {
    using Clock = std::chrono::steady_clock;
    static std::optional<Clock::time_point> last;
    static long lastOffset = 0;
    const Clock::time_point now = Clock::now();
    if (last && ::timezone == lastOffset && now - *last < std::chrono::seconds(1)) {
        return false;
    }
    ::tzset();
    last = now;
    lastOffset = ::timezone;
    return true;
}

/// The zone's offset throughout that local day; nothing near a change of the clocks. Lists hold many dates of few days.
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
    // The form that is stored; the library takes longer over it than over all the rest.
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

/// Length of the well-formed UTF-8 sequence at the beginning of the text, 0 if there is none (RFC 3629, section 4).
std::size_t sequenceLength(std::string_view text) noexcept {
    const auto byte = [&](std::size_t i) { return static_cast<unsigned char>(text[i]); };
    const auto continues = [&](std::size_t i, unsigned low, unsigned high) {
        return i < text.size() && byte(i) >= low && byte(i) <= high;
    };
    const unsigned first = byte(0);
    if (first < 0x80) {
        return 1;
    }
    if (first >= 0xC2 && first <= 0xDF) {
        return continues(1, 0x80, 0xBF) ? 2 : 0;
    }
    if (first >= 0xE0 && first <= 0xEF) {
        const unsigned low = first == 0xE0 ? 0xA0 : 0x80;
        const unsigned high = first == 0xED ? 0x9F : 0xBF;
        return continues(1, low, high) && continues(2, 0x80, 0xBF) ? 3 : 0;
    }
    if (first >= 0xF0 && first <= 0xF4) {
        const unsigned low = first == 0xF0 ? 0x90 : 0x80;
        const unsigned high = first == 0xF4 ? 0x8F : 0xBF;
        return continues(1, low, high) && continues(2, 0x80, 0xBF) && continues(3, 0x80, 0xBF) ? 4 : 0;
    }
    return 0;
}

}  // namespace

std::string textOf(const Value& value) {
    std::string text;
    appendText(text, value, 0);
    return text;
}

std::string textOf(const std::optional<std::string>& text) {
    return text ? *text : std::string(nullText);
}

std::string textOf(const Error& error) {
    std::string text = fmt::format("{} ({})", error.domain, error.code);
    if (error.description) {
        text += ": " + *error.description;
    }
    return text;
}

std::string textOf(const std::optional<Error>& error) {
    return error ? textOf(*error) : std::string(nullText);
}

bool booleanOf(const Value& value) noexcept {
    return truthOf(value, false);
}
bool flagOf(const Value& value) noexcept {
    return truthOf(value, true);
}

std::optional<Date> localDateOf(std::string_view text) {
    std::optional<std::tm> parts = datePartsOf(text);
    if (!parts) {
        return std::nullopt;
    }
    // The C library accepts 30 February and a 61st second and moves them on; a stored date that does so is no date.
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

bool isUtf8(std::string_view text) noexcept {
    while (!text.empty()) {
        // Most texts are ASCII alone: eight characters at a time.
        std::uint64_t eight = 0;
        if (text.size() >= sizeof eight) {
            std::memcpy(&eight, text.data(), sizeof eight);
            if ((eight & 0x8080808080808080U) == 0) {
                text.remove_prefix(sizeof eight);
                continue;
            }
        }
        const std::size_t length = sequenceLength(text);
        if (length == 0) {
            return false;
        }
        text.remove_prefix(length);
    }
    return true;
}

std::string utf8Of(std::string_view bytes) {
    std::string text;
    text.reserve(bytes.size());
    while (!bytes.empty()) {
        const std::size_t length = sequenceLength(bytes);
        text += length == 0 ? replacement : bytes.substr(0, length);
        bytes.remove_prefix(length == 0 ? 1 : length);
    }
    return text;
}

}  // namespace adminhost
