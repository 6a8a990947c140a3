#include "adminhostd/ToolConfiguration.h"

#include "adminhostd/PrivateDirectory.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <system_error>

namespace adminhost {

namespace fs = std::filesystem;

ToolConfiguration::ToolConfiguration(const std::string& parent) {
    _held = createPrivateDirectory(parent, _directory);
}

ToolConfiguration::~ToolConfiguration() {
    std::error_code ignored;
    fs::remove_all(_directory, ignored);
}

std::optional<Error> writeToolFiles(const std::string& directory, const std::vector<ToolFile>& files) {
    const auto failed = [](const std::string& path, const std::string& reason) {
        return Error{"posix", errno, path + ": " + reason};
    };
    std::error_code error;
    fs::create_directories(directory, error);
    fs::permissions(directory, fs::perms::owner_all, error);
    for (const ToolFile& file : files) {
        const fs::path relative(file.path);
        if (relative.empty() || relative.is_absolute() ||
            std::any_of(relative.begin(), relative.end(), [](const fs::path& part) { return part == ".."; })) {
            return failed(file.path, "is not a path below the directory");
        }
        const fs::path path = directory / relative;
        fs::create_directories(path.parent_path(), error);
        std::ofstream stream(path, std::ios::binary);
        stream << file.text;
        stream.close();
        if (!stream) {
            return failed(path, error ? error.message() : std::generic_category().message(errno));
        }
    }
    return std::nullopt;
}

}  // namespace adminhost
