#include "adminhostd/PrivateDirectory.h"

#include <cerrno>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <system_error>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr const char* prefix = "adminhostd.";

FileDescriptor opened(const std::string& path) noexcept {
    return FileDescriptor(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
}

bool isOurs(int directory) noexcept {
    struct stat status {};
    return ::fstat(directory, &status) == 0 && status.st_uid == ::geteuid();
}

}  // namespace

FileDescriptor createPrivateDirectory(const std::string& parent, std::string& path) {
    for (;;) {
        path = parent + "/" + prefix + "XXXXXX";
        if (::mkdtemp(path.data()) == nullptr) {
            throw std::system_error(errno, std::generic_category(), "cannot create a private directory in " + parent);
        }
        FileDescriptor held = holdDirectory(path);
        if (held.isOpen()) {
            return held;
        }
        // Another daemon that has just started has removed it, because no process held it yet.
        if (errno != ENOENT) {
            throw std::system_error(errno, std::generic_category(), "cannot use " + path);
        }
    }
}

FileDescriptor holdDirectory(const std::string& path) {
    FileDescriptor directory = opened(path);
    struct stat status {};
    if (directory.isOpen() && (::flock(directory.get(), LOCK_SH) != 0 || ::stat(path.c_str(), &status) != 0)) {
        directory.close();  // errno stays
    }
    return directory;
}

void removeAbandonedDirectories(const std::string& parent) noexcept {
    try {
        for (const auto& entry : std::filesystem::directory_iterator(parent)) {
            if (!entry.path().filename().string().starts_with(prefix) || entry.is_symlink() || !entry.is_directory()) {
                continue;
            }
            const FileDescriptor directory = opened(entry.path());
            if (directory.isOpen() && isOurs(directory.get()) && ::flock(directory.get(), LOCK_EX | LOCK_NB) == 0) {
                std::error_code left;  // the next start tries again
                std::filesystem::remove_all(entry.path(), left);
            }
        }
    } catch (const std::exception&) {
        // A directory that cannot be read is reported when the socket or a private directory is created in it.
    }
}

}  // namespace adminhost
