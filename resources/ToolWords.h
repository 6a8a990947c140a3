#pragma once

// A tool's own words, for reports.

#include "platform/value/Error.h"

#include <string>
#include <string_view>

namespace lumio {

/// What a tool printed as its error, else its output, without line feeds at the end and in at most 1000 bytes.
[[nodiscard]] std::string toolWords(std::string_view error, std::string_view output);
/// What the database tool printed, by the description of a failed statement.
[[nodiscard]] std::string toolWords(const adminhost::Error& error);

}  // namespace lumio
