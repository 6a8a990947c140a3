#pragma once

// The statements that reach the database tool of a test's root.

#include "tests/support/TemporaryRoot.h"

#include <filesystem>
#include <sstream>
#include <string>
#include <vector>

namespace adminhost::test {

/// Records every run of the database tool while it exists; the real tool runs the statements.
class RecordedStatements {
  public:
    explicit RecordedStatements(const TemporaryRoot& root) : _root(root) {
        // 036 is the record separator: statements may hold line feeds.
        _root.writeTool(tool, "#!/bin/sh\n[ $# -eq 3 ] && [ \"$1\" = -line ] || exit 99\nprintf '%s\\036' \"$3\" >> '" +
                                  _root.path(record).string() + "'\nexec /usr/bin/sqlite3 \"$@\"\n");
    }
    RecordedStatements(const RecordedStatements&) = delete;
    RecordedStatements& operator=(const RecordedStatements&) = delete;
    ~RecordedStatements() {
        std::error_code ignored;
        std::filesystem::remove(_root.path(tool), ignored);
        std::filesystem::create_symlink("/usr/bin/sqlite3", _root.path(tool), ignored);
    }

    /// The statements since the last call, in their order.
    [[nodiscard]] std::vector<std::string> take() const {
        std::vector<std::string> statements;
        std::istringstream text(_root.read(record));
        for (std::string statement; std::getline(text, statement, '\036');) {
            statements.push_back(statement);
        }
        std::filesystem::remove(_root.path(record));
        return statements;
    }
    /// The same, every date and time written as NOW.
    [[nodiscard]] std::vector<std::string> takeWithoutTimes() const;

  private:
    static constexpr std::string_view tool = "/usr/bin/sqlite3";
    static constexpr std::string_view record = "/statements";

    const TemporaryRoot& _root;
};

}  // namespace adminhost::test
