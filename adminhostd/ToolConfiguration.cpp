#include "adminhostd/ToolConfiguration.h"

#include "adminhostd/PrivateDirectory.h"

#include <cerrno>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <system_error>

#include <sys/stat.h>

namespace adminhost {
namespace {

// The answers of the settings themselves must not end up among the rows.
constexpr const char* startFile =
    ".output /dev/null\n"
    ".dbconfig dqs_dml on\n"
    ".dbconfig dqs_ddl on\n"
    ".output\n";

}  // namespace

ToolConfiguration::ToolConfiguration(const std::string& parent) {
    _held = createPrivateDirectory(parent, _directory);
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

}  // namespace adminhost
