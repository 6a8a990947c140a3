#pragma once

// Statements on the service's database, each run by one start of the sqlite3 tool in its line output mode.
//
// The statement is one argument of the tool, never seen by a shell; its caller has inserted values verbatim. That is
// the service's contract: nothing is escaped, quoted otherwise or bound here.

#include "platform/task/TaskGroup.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <functional>
#include <string>
#include <string_view>
#include <vector>

namespace lumio {

/// Runs the statement on the database at SettingsStore::dbPath() and returns what the tool printed, or the error:
/// domain "sqliteQuery", the tool's exit status (-1 if it could not be started) and its error text. A database path
/// that begins with a hyphen is a failure with code 1 and runs no tool, which would read it as an option.
/// `outputGrows` is called as a TaskPlan's.
[[nodiscard]] adminhost::Result<std::string> statementOutput(const std::string& statement,
                                                             std::function<void(std::string_view)> outputGrows = {});

/// Runs the statement likewise. Returns the rows in output order, each a dictionary of texts by column name (NULL is
/// the empty text); empty if the statement prints nothing. Rows printed before a failure are dropped.
[[nodiscard]] adminhost::Result<std::vector<adminhost::Dictionary>> runStatement(const std::string& statement);

/// The plan of the tool's run for the statement, on the database at SettingsStore::dbPath().
[[nodiscard]] adminhost::TaskPlan planOf(const std::string& statement);
/// The same on a given database, for many statements: looking for the path reads settings files.
[[nodiscard]] adminhost::TaskPlan planOf(const adminhost::HostPath& database, const std::string& statement);
/// What runStatement() returns for the result of that run.
[[nodiscard]] adminhost::Result<std::vector<adminhost::Dictionary>> rowsOf(adminhost::TaskResult result);
/// The failure of a listing whose database does not exist. Listings check first, because the tool would create an empty
/// file.
[[nodiscard]] adminhost::Error missingDatabase();

/// The rows in the tool's line output.
[[nodiscard]] std::vector<adminhost::Dictionary> recordsOfLineOutput(std::string_view output);

}  // namespace lumio
