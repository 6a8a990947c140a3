#pragma once

// A system root of the test's own: an empty directory below the test's temporary directory, set as the process's system
// root and removed at the end, with the real sqlite3 tool at its place; and the log lines that the test causes.

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

    /// Where a host path lies.
    [[nodiscard]] std::filesystem::path path(std::string_view hostPath) const;
    /// Writes a file, making its directories.
    void write(std::string_view hostPath, std::string_view text) const;
    /// As write, with the mode 0755.
    void writeTool(std::string_view hostPath, std::string_view text) const;
    /// A property list whose top-level dictionary has this content, in the format's own elements.
    void writePropertyList(std::string_view hostPath, std::string_view dictionaryContent) const;
    [[nodiscard]] std::string read(std::string_view hostPath) const;
    /// Runs statements on a database with the real tool and answers its output; a failure throws.
    std::string sql(std::string_view database, const std::string& statements) const;

  private:
    std::filesystem::path _directory;
};

}  // namespace adminhost::test
