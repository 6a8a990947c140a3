#include "adminhostd/DatabaseTool.h"

#include "platform/files/Path.h"
#include "platform/task/Task.h"

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <system_error>

#include <fmt/format.h>
#include <sys/stat.h>

namespace adminhost {
namespace {

// The answers of the settings themselves must not end up among the rows.
constexpr const char* startFile =
    ".output /dev/null\n"
    ".dbconfig dqs_dml on\n"
    ".dbconfig dqs_ddl on\n"
    ".output\n";

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

ToolConfiguration::ToolConfiguration(const std::string& parent) : _directory(parent + "/adminhostd.XXXXXX") {
    if (::mkdtemp(_directory.data()) == nullptr) {
        throw std::system_error(errno, std::generic_category(), "cannot make a private directory in " + parent);
    }
    const std::string place = _directory + "/sqlite3";
    std::ofstream file;
    if (::mkdir(place.c_str(), 0700) == 0) {
        file.open(place + "/sqliterc");
        file << startFile;
        file.close();
    }
    if (!file) {
        const int failure = errno;
        std::error_code ignored;
        std::filesystem::remove_all(_directory, ignored);
        throw std::system_error(failure, std::generic_category(), "cannot write in " + _directory);
    }
}

ToolConfiguration::~ToolConfiguration() {
    std::error_code ignored;
    std::filesystem::remove_all(_directory, ignored);
}

std::optional<std::string> databaseToolProblem() {
    const HostPath tool("/usr/bin/sqlite3");
    std::string output;
    std::string error;
    const std::int32_t status = launch_task(diskPath(tool), {"-line", ":memory:", statement}, &output, &error);
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
