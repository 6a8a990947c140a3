#pragma once

// The database tool: how it is run, and the check whether it prints rows in the form that this plug-in reads.

#include "platform/files/Path.h"
#include "platform/framework/Plugin.h"
#include "platform/task/TaskGroup.h"

#include <optional>
#include <string>
#include <utility>
#include <vector>

#include <sys/types.h>

namespace lumio {

class DatabaseAccess;

/// The plan of a run of the tool with the rights that it has on this database (DatabaseAccess.h). A run that is refused
/// is a tool that is not started.
[[nodiscard]] adminhost::TaskPlan databaseToolPlan(const adminhost::HostPath& database,
                                                   std::vector<std::string> arguments);

class DatabaseTool {
  public:
    /// The home directory of an account, as the account database has it. The tool looks there for its start file,
    /// whatever HOME says. Empty if the account is unknown.
    [[nodiscard]] static std::string homeOf(uid_t account);

    /// Tests give the home directory of every account.
    explicit DatabaseTool(std::optional<std::string> home = std::nullopt) : _home(std::move(home)) {}

    /// Unusable while the tool must not run on the database, or reads a start file of its account: that can change the
    /// output of every run. Both are looked at each time. Otherwise the tool is tried once, with a statement whose
    /// output is known. The result "usable" is kept; after any other result the tool is tried again. If there is no
    /// database file, no command needs the tool, and it is not tried.
    [[nodiscard]] adminhost::Probe probe();
    /// The start file that the tool reads in the home directory of its account; nullopt if there is none. A confined
    /// tool can read none, unless it is in the database's directory.
    [[nodiscard]] std::optional<adminhost::Probe> startFileProblem() const;
    /// Tries the tool, whether or not there is a database file.
    [[nodiscard]] adminhost::Probe tryTool() const;

  private:
    [[nodiscard]] std::optional<adminhost::Probe> startFileProblem(const DatabaseAccess& access) const;

    std::optional<std::string> _home;
    bool _usable = false;
};

/// The tool's start file, for its private configuration directory: it lets releases that refuse double-quoted text
/// accept it.
[[nodiscard]] adminhost::ToolFile databaseToolStartFile();

}  // namespace lumio
