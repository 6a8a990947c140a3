#pragma once

// A tool's own error text, for reports.

#include "platform/value/Error.h"

#include <string>
#include <string_view>

namespace lumio {

/// The error output of a tool, else its output, without line feeds at the end and in at most 1000 bytes.
[[nodiscard]] std::string toolWords(std::string_view error, std::string_view output);
/// The output of the database tool, from the description of a failed statement.
[[nodiscard]] std::string toolWords(const adminhost::Error& error);

}  // namespace lumio
