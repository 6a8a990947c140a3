#pragma once

// Numbers of rows, counted by the database.

#include <cstdint>
#include <string>
#include <vector>

namespace lumio {

struct CountStatement {
    std::string statement;  ///< "select count(*) from ..."
    std::string onFailure;  ///< beginning of the log line; the error follows
};

/// The number in the last row of each statement's result. The statements run several at a time (StatementBatch.h). A
/// failure is logged and counts 0; the lines are in the order of the statements.
[[nodiscard]] std::vector<std::uint64_t> rowCounts(const std::vector<CountStatement>& counts);

}  // namespace lumio
