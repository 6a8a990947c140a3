#pragma once

// Rows of the properties table whose value runs over several lines.
//
// A protected value is wrapped base64. The tool's line output shows only its first line under "value": each further
// line is read as an entry of its own whose key is its last word, and a line feed at its end closes the record early,
// so that the row's other columns come as a record of their own. Here such pieces and records become one row again.

#include "platform/value/Value.h"

#include <vector>

namespace lumio {

/// One dictionary for each row, with the whole text under "value". Lines of a plain value that look like a column of
/// their own ("a = b") stay entries of their own; in a row with "protect" t whatever stands between the value and the
/// next column is part of the value or is dropped.
[[nodiscard]] std::vector<adminhost::Dictionary> wholePropertyRows(std::vector<adminhost::Dictionary> records);

}  // namespace lumio
