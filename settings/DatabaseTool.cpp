#include "settings/DatabaseTool.h"

#include "platform/files/Path.h"
#include "platform/task/Task.h"
#include "platform/task/TaskBounds.h"
#include "platform/value/ValueText.h"
#include "settings/DatabaseAccess.h"
#include "settings/SettingsStore.h"

#include <array>
#include <cerrno>
#include <chrono>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>

#include <pwd.h>
#include <unistd.h>

namespace lumio {

using adminhost::Probe;

namespace {

constexpr std::int32_t diedBySignal = 128;
constexpr const char* toolPath = "/usr/bin/sqlite3";

// Everything that the readers of rows rely on: double-quoted text is text, names are padded to the longest, an absent
// value is empty, and control characters are printed as they are.
constexpr const char* statement =
    "select 'x = y' as a, \"quoted text\" as longername, null as c where 'quoted text' = \"quoted text\" "
    "union all select 2, 3.5, '' "
    "union all select 3, 'line' || char(10) || 'feed' || char(9) || 'tab' || char(27) || 'escape', 'z'";
constexpr const char* expected =
    "         a = x = y\n"
    "longername = quoted text\n"
    "         c = \n"
    "\n"
    "         a = 2\n"
    "longername = 3.5\n"
    "         c = \n"
    "\n"
    "         a = 3\n"
    "longername = line\nfeed\ttab\x1b"
    "escape\n"
    "         c = z\n";

/// Returns true if a failed run is more likely due to the state of the machine at this moment than to the tool.
bool isPassing(std::int32_t status, std::string_view error) {
    if (status == diedBySignal + SIGKILL || std::chrono::steady_clock::now() >= adminhost::taskDeadline()) {
        return true;  // at the deadline, not started because of it, or because memory ran out
    }
    for (const int number : {EAGAIN, ENOMEM, EMFILE, ENFILE, ETXTBSY, EINTR}) {
        if (error.find(std::strerror(number)) != std::string_view::npos) {
            return true;
        }
    }
    return error.find("out of memory") != std::string_view::npos;
}

std::string firstLine(const std::string& text) {
    return text.substr(0, text.find('\n'));
}

}  // namespace

adminhost::TaskPlan databaseToolPlan(const adminhost::HostPath& database, std::vector<std::string> arguments) {
    adminhost::TaskPlan plan{.tool = adminhost::diskPath(adminhost::HostPath(toolPath)),
                             .arguments = std::move(arguments),
                             .environment = adminhost::toolFileVariables(),
                             .noNewPrivileges = true};
    const auto access = DatabaseAccess::of(database);
    if (!access) {
        plan.refusal = "not started: " + access.error().reason + "; " + access.error().fix;
        return plan;
    }
    plan.rights = access->account();
    auto confinement = access->confine(plan.tool);
    if (!confinement) {
        plan.refusal =
            "not started, because it cannot be confined: " + adminhost::textOf(confinement.error().description);
        return plan;
    }
    plan.confinement = *std::move(confinement);
    if (plan.confinement) {
        // The tool can read neither the account database nor, in that directory, a start file.
        plan.environment["HOME"] = "/";
        if (std::string directory = access->directory(); !directory.empty()) {
            plan.environment["SQLITE_TMPDIR"] = std::move(directory);  // the usual ones are not allowed
        }
    }
    return plan;
}

std::string DatabaseTool::homeOf(uid_t account) {
    passwd entry{};
    passwd* found = nullptr;
    std::array<char, 16384> buffer{};
    const int failure = ::getpwuid_r(account, &entry, buffer.data(), buffer.size(), &found);
    return failure == 0 && found != nullptr ? std::string(entry.pw_dir) : std::string();
}

Probe DatabaseTool::probe() {
    const adminhost::HostPath database = SettingsStore::dbPath();
    if (!adminhost::exists(adminhost::diskPath(database))) {
        return {};
    }
    const auto access = DatabaseAccess::of(database);
    if (!access) {
        return {Probe::State::unusable, access.error().reason, access.error().fix};
    }
    if (auto problem = startFileProblem(*access)) {
        return *std::move(problem);
    }
    Probe probe = _usable ? Probe() : tryTool();
    _usable = probe.state == Probe::State::usable;
    return probe;
}

std::optional<Probe> DatabaseTool::startFileProblem() const {
    const auto access = DatabaseAccess::of(SettingsStore::dbPath());
    return access ? startFileProblem(*access) : std::nullopt;  // without access the tool does not run at all
}

std::optional<Probe> DatabaseTool::startFileProblem(const DatabaseAccess& access) const {
    const std::string home = _home ? *_home : homeOf(access.account() ? access.account()->user : ::geteuid());
    const std::string startFile = home + "/.sqliterc";
    if (::access(startFile.c_str(), F_OK) != 0) {
        return std::nullopt;
    }
    const auto confinement = access.confine(adminhost::diskPath(adminhost::HostPath(toolPath)));
    if (confinement && *confinement) {
        std::error_code unknown;
        const std::string place = std::filesystem::canonical(startFile, unknown).string();
        if (!unknown && !place.starts_with(access.directory() + '/')) {
            return std::nullopt;
        }
    }
    return Probe{Probe::State::unusable, startFile + " can change what " + toolPath + " prints",
                 "remove the file, or move it away"};
}

Probe DatabaseTool::tryTool() const {
    const adminhost::HostPath tool(toolPath);
    adminhost::TaskGroup run;
    const auto [status, output, error] =
        run.collect(run.start(databaseToolPlan(SettingsStore::dbPath(), {"-line", ":memory:", statement})));
    if (status != 0 && isPassing(status, error)) {
        return {Probe::State::unknown,
                status == diedBySignal + SIGKILL ? tool.text() + " was ended before it had finished" : firstLine(error),
                "try again later"};
    }
    if (status == -1) {
        return {Probe::State::unusable, tool.text() + " cannot be run (" + firstLine(error) + ")",
                "install the package sqlite3"};
    }
    if (status != 0) {
        return {Probe::State::unusable,
                tool.text() + " failed with status " + std::to_string(status) + ": " + firstLine(error),
                "install a supported release of the package sqlite3"};
    }
    if (output != expected) {
        return {Probe::State::unusable, tool.text() + " does not print rows in the form that this release reads",
                "install a supported release of the package sqlite3"};
    }
    return {};
}

adminhost::ToolFile databaseToolStartFile() {
    // The output of these settings themselves must not end up among the rows.
    return {"sqlite3/sqliterc",
            ".output /dev/null\n"
            ".dbconfig dqs_dml on\n"
            ".dbconfig dqs_ddl on\n"
            ".output\n"};
}

}  // namespace lumio
