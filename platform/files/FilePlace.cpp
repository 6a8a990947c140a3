#include "platform/files/FilePlace.h"

#include <array>
#include <cerrno>
#include <climits>
#include <string_view>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr int mostLinks = 40;  // as many as the kernel follows

/// Walks from the current directory, or from "/", down to the directory that the text names.
int walk(std::string text, FileDescriptor& directory) {
    int links = 0;
    directory = FileDescriptor(::open(text.starts_with('/') ? "/" : ".", O_PATH | O_DIRECTORY | O_CLOEXEC));
    while (directory.isOpen()) {
        const std::size_t begin = text.find_first_not_of('/');
        if (begin == std::string::npos) {
            return 0;
        }
        const std::size_t end = text.find('/', begin);
        const std::string component = text.substr(begin, end == std::string::npos ? end : end - begin);
        text.erase(0, end);
        FileDescriptor next(::openat(directory.get(), component.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
        struct stat status {};
        if (!next.isOpen() || ::fstat(next.get(), &status) != 0) {
            return errno;
        }
        if (!S_ISLNK(status.st_mode)) {
            directory = std::move(next);
            continue;
        }
        struct stat parent {};
        if (::fstat(directory.get(), &parent) != 0) {
            return errno;
        }
        if (++links > mostLinks || othersMayWrite(parent)) {
            return ELOOP;
        }
        std::array<char, PATH_MAX> target{};
        const ssize_t length = ::readlinkat(next.get(), "", target.data(), target.size());
        if (length < 0) {
            return errno;
        }
        text.insert(0, std::string_view(target.data(), static_cast<std::size_t>(length)));
        if (text.starts_with('/')) {
            directory = FileDescriptor(::open("/", O_PATH | O_DIRECTORY | O_CLOEXEC));
        }
    }
    return errno;
}

}  // namespace

bool othersMayWrite(const struct stat& directory) noexcept {
    return (directory.st_mode & (S_IWGRP | S_IWOTH)) != 0 || (directory.st_uid != 0 && directory.st_uid != ::geteuid());
}

int openPlace(const DiskPath& path, FilePlace& place) {
    const std::string& text = path.text();
    const std::size_t slash = text.rfind('/');
    std::string name = slash == std::string::npos ? text : text.substr(slash + 1);
    if (name.empty() || name == "." || name == ".." || text.find('\0') != std::string::npos) {
        return EINVAL;
    }
    FileDescriptor directory;
    const std::string parent = slash == std::string::npos ? "" : text.substr(0, slash + 1);
    if (const int failure = walk(parent, directory); failure != 0) {
        return failure;
    }
    // Opened anew: a descriptor that only names a directory can be neither listed nor flushed.
    place.directory = FileDescriptor(::openat(directory.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    place.name = std::move(name);
    return place.directory.isOpen() ? 0 : errno;
}

}  // namespace adminhost
