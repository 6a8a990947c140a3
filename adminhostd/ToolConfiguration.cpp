#include "adminhostd/ToolConfiguration.h"

#include "adminhostd/PrivateDirectory.h"

#include <algorithm>
#include <cerrno>
#include <filesystem>
#include <fstream>
#include <system_error>

namespace adminhost {

namespace fs = std::filesystem;

namespace {

// A tool may run as another account than the worker, and must be able to read its files.
constexpr fs::perms forSearching = fs::perms(0711);
constexpr fs::perms forReading = fs::perms(0644);

}  // namespace

ToolConfiguration::ToolConfiguration(const std::string& parent) {
    _held = createPrivateDirectory(parent, _directory);
    std::error_code notOpened;  // the tools of our own account read it all the same
    fs::permissions(_directory, forSearching, notOpened);
}

ToolConfiguration::~ToolConfiguration() {
    std::error_code ignored;
    fs::remove_all(_directory, ignored);
}

Result<void> writeToolFiles(const std::string& directory, const std::vector<ToolFile>& files) {
    const auto failed = [](const std::string& path, const std::string& reason) {
        return failure(Error{"posix", errno, path + ": " + reason});
    };
    std::error_code error;
    // Only inside the private directory: a worker whose front has ended and cleaned up must not create it again.
    fs::create_directory(directory, error);
    fs::permissions(directory, forSearching, error);
    for (const ToolFile& file : files) {
        const fs::path relative(file.path);
        if (relative.empty() || relative.is_absolute() ||
            std::any_of(relative.begin(), relative.end(), [](const fs::path& part) { return part == ".."; })) {
            return failed(file.path, "is not a path below the directory");
        }
        const fs::path path = directory / relative;
        fs::path part = directory;
        for (const fs::path& name : relative.parent_path()) {
            fs::create_directory(part /= name, error);
            fs::permissions(part, forSearching, error);
        }
        std::ofstream stream(path, std::ios::binary);
        stream << file.text;
        stream.close();
        fs::permissions(path, forReading, error);
        if (!stream) {
            return failed(path, error ? error.message() : std::generic_category().message(errno));
        }
    }
    return {};
}

}  // namespace adminhost
