#pragma once

// Dates for people who want to know how long ago something was.

#include "platform/value/Value.h"

#include <chrono>
#include <string>

namespace adminhost::ctl {

/// "2 minutes ago, 22:38:05": local time, with the day if it is not that of `now` ("3 days ago, 28 Jan 2026,
/// 16:43:00"). A date that is still to come is "in 5 minutes, 22:45:00".
[[nodiscard]] std::string dateWithAge(Date date, std::chrono::system_clock::time_point now);

}  // namespace adminhost::ctl
