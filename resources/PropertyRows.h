#pragma once

// Rows of the properties table with the exact texts of their columns, whatever lines a value contains.

#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <functional>
#include <string>
#include <vector>

namespace lumio {

/// The number of rows a statement can have: one that asks for an id has no second row, whatever its text looks like.
enum class RowCount { any, atMostOne };

/// Runs "select COLUMNS REST" and returns its rows, columns in the statement's order. COLUMNS is "*" or
/// "id,name,value".
///
/// The rows are read from the raw text of the tool's output (LineRows.h). If a row of that text can be read in more
/// than one way, the ids are not numbers in ascending order, there are too many rows, or it holds U+FFFD, which may be
/// a byte that is not UTF-8, one further statement fetches the texts as hexadecimal digits. Texts are then the stored
/// bytes, which need not be UTF-8. Otherwise the tool runs once.
///
/// What this cannot notice: a value that ends with the rest of its row, an empty line and the beginning of another row,
/// whose id is free and in order. The tool prints the same bytes for it as for two rows, so that every listing of two
/// rows would have to be fetched twice. Such a row is listed, and what comes before it counts as the whole value; the
/// statements for one id (RowCount::atMostOne) read that value as it is stored, and no row has the listed id.
[[nodiscard]] adminhost::Result<std::vector<adminhost::Dictionary>> propertyRows(const std::string& columns,
                                                                                 const std::string& rest,
                                                                                 RowCount count = RowCount::any);

/// Receives the rows of propertyRows() one by one, the first ones while the tool is still writing the others.
struct PropertyRowReceiver {
    std::function<void(adminhost::Dictionary)> add;
    /// The rows so far do not count: the same statement's rows follow, read in another way, or its failure.
    std::function<void()> discard;
};
[[nodiscard]] adminhost::Result<void> readPropertyRows(const std::string& columns, const std::string& rest,
                                                       RowCount count, const PropertyRowReceiver& receiver);

}  // namespace lumio
