#include "settings/QueryRunner.h"

#include "settings/DatabaseTool.h"
#include "settings/LineRows.h"
#include "settings/SettingsStore.h"

namespace lumio {

using adminhost::Dictionary;
using adminhost::Error;

namespace {

constexpr const char* failed = "Can't execute sqlite3 query: ";

/// The place where the first separator begins. Searches for its middle, because lines begin with blanks.
std::size_t separatorIn(std::string_view line) noexcept {
    for (std::size_t at = line.find('=', 1); at < line.size(); at = line.find('=', at + 1)) {
        if (line.substr(at - 1, columnSeparator.size()) == columnSeparator) {
            return at - 1;
        }
    }
    return std::string_view::npos;
}

/// The tool would read such a path as one of its options, and one of those runs commands.
bool beginsWithHyphen(const adminhost::HostPath& database) noexcept {
    return database.text().starts_with('-');
}

}  // namespace

std::vector<Dictionary> recordsOfLineOutput(std::string_view output) {
    std::vector<Dictionary> records;
    if (output.empty()) {
        return records;
    }
    // Every row ends with an empty line; the last row's is the empty element after the final line feed. An output that
    // does not end in a line feed therefore loses its last row, which the tool never printed whole.
    Dictionary pending;
    for (std::size_t begin = 0; begin <= output.size();) {
        const std::size_t end = std::min(output.find('\n', begin), output.size());
        const std::string_view line = output.substr(begin, end - begin);
        begin = end + 1;
        if (line.empty()) {
            records.push_back(std::move(pending));
            pending = Dictionary();
            continue;
        }
        const std::size_t split = separatorIn(line);
        // A line without separator, such as the second line of a value, is its own value.
        const bool splits = split != std::string_view::npos;
        std::string_view key = splits ? line.substr(0, split) : line;
        const std::string_view value = splits ? line.substr(split + columnSeparator.size()) : line;
        // Column names are padded on the left; one that holds a blank itself keeps only its last word.
        if (const std::size_t blank = key.rfind(' '); blank != std::string_view::npos) {
            key.remove_prefix(blank + 1);
        }
        pending.set(key, value);
    }
    return records;
}

adminhost::TaskPlan planOf(const adminhost::HostPath& database, const std::string& statement) {
    const std::string file = adminhost::diskPath(database).text();
    return databaseToolPlan(database, {"-line", (file.starts_with('-') ? "./" : "") + file, statement});
}

adminhost::TaskPlan planOf(const std::string& statement) {
    return planOf(SettingsStore::dbPath(), statement);
}

static adminhost::Result<std::string> outputOf(adminhost::TaskResult result) {
    if (result.status != 0) {
        return adminhost::failure(Error{"sqliteQuery", result.status, failed + result.error});
    }
    return std::move(result.output);
}

adminhost::Result<std::vector<Dictionary>> rowsOf(adminhost::TaskResult result) {
    return outputOf(std::move(result)).map([](const std::string& output) { return recordsOfLineOutput(output); });
}

adminhost::Result<std::string> statementOutput(const std::string& statement,
                                               std::function<void(std::string_view)> outputGrows) {
    const adminhost::HostPath database = SettingsStore::dbPath();
    if (beginsWithHyphen(database)) {
        return adminhost::failure(
            Error{"sqliteQuery", 1, failed + ("Error: the database path begins with a hyphen: " + database.text())});
    }
    adminhost::TaskGroup tool;
    adminhost::TaskPlan plan = planOf(database, statement);
    plan.outputGrows = std::move(outputGrows);
    return outputOf(tool.collect(tool.start(std::move(plan))));
}

Error missingDatabase() {
    return {"sqliteQuery", 1,
            failed + ("Error: unable to open database \"" + SettingsStore::dbPath().text() +
                      "\": unable to open database file\n")};
}

adminhost::Result<std::vector<Dictionary>> runStatement(const std::string& statement) {
    return statementOutput(statement).map([](const std::string& output) { return recordsOfLineOutput(output); });
}

}  // namespace lumio
