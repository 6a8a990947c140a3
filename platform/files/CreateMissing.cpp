#include "platform/files/CreateMissing.h"

#include "platform/files/FileDescriptor.h"

#include <array>
#include <cerrno>
#include <cstdio>
#include <memory>
#include <string>
#include <system_error>

#include <fcntl.h>
#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr std::size_t maximumLine = std::size_t{64} << 20U;  ///< bytes of a group with its members

tl::unexpected<Error> failed(const char* step, int number) {
    return failure(Error{"posix", number, std::string(step) + ": " + std::generic_category().message(number)});
}

/// Sets them through a descriptor, so that a link put in the directory's place is never followed.
Result<void> setOwnerAndMode(const std::string& path, const OwnerAndMode& ownerAndMode) {
    const FileDescriptor directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    if (!directory.isOpen()) {
        return failed("cannot open the new directory", errno);
    }
    Result<void> result;
    if (::fchmod(directory.get(), ownerAndMode.mode) != 0) {
        result = failed("cannot set the mode", errno);
    }
    if (::fchown(directory.get(), ownerAndMode.owner, ownerAndMode.group) != 0) {
        result = failed("cannot set the owner", errno);
    }
    return result;
}

}  // namespace

Result<void> createDirectories(const DiskPath& path, const OwnerAndMode& ownerAndMode) {
    Result<void> result;
    const std::string& whole = path.text();
    for (std::size_t end = whole.find('/', 1); !whole.empty(); end = whole.find('/', end + 1)) {
        const std::string part = whole.substr(0, end);
        if (::mkdir(part.c_str(), 0700) == 0) {
            if (auto set = setOwnerAndMode(part, ownerAndMode); !set) {
                result = std::move(set);
            }
        } else if (errno != EEXIST) {
            return failed("cannot create the directory", errno);
        }
        if (end == std::string::npos) {
            break;
        }
    }
    struct stat status {};
    if (result && (::stat(whole.c_str(), &status) != 0 || !S_ISDIR(status.st_mode))) {
        result = failed("cannot create the directory", ENOTDIR);
    }
    return result;
}

Result<void> createEmptyFile(const DiskPath& path) {
    FileDescriptor file(::open(path.c_str(), O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0644));
    if (!file.isOpen() || ::fsync(file.get()) != 0) {
        return failed("cannot create the file", errno);
    }
    if (const int number = file.close(); number != 0) {
        return failed("cannot create the file", number);
    }
    return {};
}

std::optional<gid_t> groupIdOf(const char* name) {
    const auto close = [](std::FILE* file) { static_cast<void>(std::fclose(file)); };
    const std::unique_ptr<std::FILE, decltype(close)> file(std::fopen(diskPath(HostPath("/etc/group")).c_str(), "re"),
                                                           close);
    if (!file) {
        return std::nullopt;
    }
    std::string buffer(4096, '\0');
    group entry{};
    group* found = nullptr;
    for (;;) {
        const int status = ::fgetgrent_r(file.get(), &entry, buffer.data(), buffer.size(), &found);
        if (status == ERANGE && buffer.size() < maximumLine) {
            buffer.resize(buffer.size() * 2);  // the reader is at the line's beginning again
        } else if (status != 0) {
            return std::nullopt;
        } else if (std::string_view(entry.gr_name) == name) {
            return entry.gr_gid;
        }
    }
}

}  // namespace adminhost
