#pragma once

// A system root for one test: a directory below the test's temporary directory that contains only the real sqlite3 tool
// at its usual path. It is the process's system root and is removed at the end. It also has the log lines of the test.

#include "tests/support/CapturedLog.h"

#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::test {

class TemporaryRoot {
  public:
    TemporaryRoot();
    TemporaryRoot(const TemporaryRoot&) = delete;
    TemporaryRoot& operator=(const TemporaryRoot&) = delete;
    ~TemporaryRoot();

    /// The disk path of a host path.
    [[nodiscard]] std::filesystem::path path(std::string_view hostPath) const;
    /// Writes a file and creates its directories.
    void write(std::string_view hostPath, std::string_view text) const;
    /// As write, with the mode 0755.
    void writeTool(std::string_view hostPath, std::string_view text) const;
    /// Writes a property list whose top-level dictionary has this content, as XML elements.
    void writePropertyList(std::string_view hostPath, std::string_view dictionaryContent) const;
    [[nodiscard]] std::string read(std::string_view hostPath) const;
    /// Runs statements on a database with the real tool and returns its output. Throws on failure.
    std::string sql(std::string_view database, const std::string& statements) const;

  private:
    std::filesystem::path _directory;
};

}  // namespace adminhost::test
