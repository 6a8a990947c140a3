#pragma once

// The check of the database tool: whether it prints rows in the form that this plug-in reads.

#include "platform/framework/Plugin.h"

#include <optional>
#include <string>

namespace lumio {

class DatabaseTool {
  public:
    /// The home directory of the daemon's account, as the account database has it. The tool looks there for its start
    /// file, whatever HOME says. Empty if the account is unknown.
    [[nodiscard]] static std::string homeOfAccount();

    explicit DatabaseTool(std::string home = homeOfAccount()) : _home(std::move(home)) {}

    /// Unusable while the account has a start file of the tool: it can change the output of every run, also if it is
    /// created later, so it is looked for each time. Otherwise the tool is tried once, with a statement whose output is
    /// known. The result "usable" is kept; after any other result the tool is tried again. If there is no database
    /// file, no command needs the tool, and it is not tried.
    [[nodiscard]] adminhost::Probe probe();
    /// The start file of the tool that the account has; nullopt if there is none.
    [[nodiscard]] std::optional<adminhost::Probe> startFileProblem() const;
    /// Tries the tool, whether or not there is a database file.
    [[nodiscard]] adminhost::Probe tryTool() const;

  private:
    std::string _home;
    bool _usable = false;
};

/// The tool's start file, for its private configuration directory: it lets releases that refuse double-quoted text
/// accept it.
[[nodiscard]] adminhost::ToolFile databaseToolStartFile();

}  // namespace lumio
