#pragma once

// Rows of the properties table with the exact texts of their columns, whatever lines a value contains.

#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <string>
#include <vector>

namespace lumio {

/// The number of rows a statement can have: one that asks for an id has no second row, whatever its text looks like.
enum class RowCount { any, atMostOne };

/// Runs "select COLUMNS REST" and returns its rows, columns in the statement's order. COLUMNS is "*" or
/// "id,name,value".
///
/// The rows are read from the raw text of the tool's output (LineRows.h). If that text can be read in more than one
/// way, has an id twice or too many rows, or holds U+FFFD, which may be a byte that is not UTF-8, one further statement
/// fetches the texts as hexadecimal digits. Texts are then the stored bytes, which need not be UTF-8. Otherwise the
/// tool runs once.
[[nodiscard]] adminhost::Result<std::vector<adminhost::Dictionary>> propertyRows(const std::string& columns,
                                                                                 const std::string& rest,
                                                                                 RowCount count = RowCount::any);

}  // namespace lumio
