#pragma once

// Whether the database tool prints what the plug-ins read.

#include <optional>
#include <string>

namespace adminhost {

/// Runs a statement through the tool whose answer is known, double-quoted text and awkward values included. Nothing
/// when the lines that come back are the expected ones, else what is wrong.
[[nodiscard]] std::optional<std::string> databaseToolProblem();

}  // namespace adminhost
