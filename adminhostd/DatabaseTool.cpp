#include "adminhostd/DatabaseTool.h"

#include "platform/files/Path.h"
#include "platform/task/Task.h"

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr const char* statement =
    "select 'x = y' as a, \"quoted text\" as longername, null as c where 'quoted text' = \"quoted text\" "
    "union all select 2, 3.5, ''";
constexpr const char* expected =
    "         a = x = y\n"
    "longername = quoted text\n"
    "         c = \n"
    "\n"
    "         a = 2\n"
    "longername = 3.5\n"
    "         c = \n";

}  // namespace

std::optional<std::string> databaseToolProblem() {
    const HostPath tool("/usr/bin/sqlite3");
    std::string output;
    std::string error;
    const std::int32_t status = launch_task(diskPath(tool), {"-line", ":memory:", statement}, &output, &error);
    if (status == -1) {
        return fmt::format("{} cannot be run ({}); install Debian's package sqlite3", tool.text(), error);
    }
    if (status != 0) {
        return fmt::format("{} failed with status {}: {}", tool.text(), status, error.substr(0, error.find('\n')));
    }
    if (output != expected) {
        return fmt::format(
            "{} does not print rows as this release reads them; install a supported one, or remove the account's "
            ".sqliterc",
            tool.text());
    }
    return std::nullopt;
}

}  // namespace adminhost
