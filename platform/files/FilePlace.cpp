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

/// How far a path was followed.
struct Walk {
    FileDescriptor here;  ///< only names it (O_PATH)
    struct stat status {};
    FileDescriptor directory;  ///< the directory that `here` was found in; closed for the beginning
    struct stat directoryStatus {};
    std::string rest;  ///< what was not followed

    bool begin(const char* path) {
        directory.close();
        here = FileDescriptor(::open(path, O_PATH | O_DIRECTORY | O_CLOEXEC));
        return here.isOpen() && ::fstat(here.get(), &status) == 0;
    }
};

/// Walks from the current directory, or from "/", down to what the text names. Visits each step with the attributes of
/// the directory and of its entry, links included; a visitor ends the walk with an error number.
template <typename Visitor>
int follow(std::string text, Walk& walk, Visitor visit) {
    int links = 0;
    bool begun = walk.begin(text.starts_with('/') ? "/" : ".");
    while (begun) {
        const std::size_t begin = text.find_first_not_of('/');
        if (begin == std::string::npos) {
            return 0;
        }
        const std::size_t end = text.find('/', begin);
        const std::string component = text.substr(begin, end == std::string::npos ? end : end - begin);
        text.erase(0, end);
        FileDescriptor next(::openat(walk.here.get(), component.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
        struct stat status {};
        if (!next.isOpen() || ::fstat(next.get(), &status) != 0) {
            walk.rest = text;
            return errno;
        }
        if (const int failure = visit(walk.status, status); failure != 0) {
            return failure;
        }
        if (!S_ISLNK(status.st_mode)) {
            walk.directory = std::exchange(walk.here, std::move(next));
            walk.directoryStatus = std::exchange(walk.status, status);
            continue;
        }
        if (++links > mostLinks) {
            return ELOOP;
        }
        std::array<char, PATH_MAX> target{};
        const ssize_t length = ::readlinkat(next.get(), "", target.data(), target.size());
        if (length < 0) {
            return errno;
        }
        text.insert(0, std::string_view(target.data(), static_cast<std::size_t>(length)));
        if (text.starts_with('/')) {
            begun = walk.begin("/");
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
    Walk walk;
    const std::string parent = slash == std::string::npos ? "" : text.substr(0, slash + 1);
    const auto refuseOthersLinks = [](const struct stat& directory, const struct stat& entry) {
        return S_ISLNK(entry.st_mode) && othersMayWrite(directory) ? ELOOP : 0;
    };
    if (const int failure = follow(parent, walk, refuseOthersLinks); failure != 0) {
        return failure;
    }
    // Opened anew: a descriptor that only names a directory can be neither listed nor flushed.
    place.directory = FileDescriptor(::openat(walk.here.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    place.name = std::move(name);
    return place.directory.isOpen() ? 0 : errno;
}

int openRoute(const DiskPath& path, FileRoute& route) {
    if (path.text().empty() || path.text().find('\0') != std::string::npos) {
        return EINVAL;
    }
    Walk walk;
    const int failure = follow(path.text(), walk, [&route](const struct stat& directory, const struct stat& entry) {
        route.steps.push_back({directory, entry});
        return 0;
    });
    if (failure != 0 && (failure != ENOENT || !walk.here.isOpen())) {
        return failure;
    }
    if (failure == ENOENT || S_ISDIR(walk.status.st_mode)) {
        route.directory = std::move(walk.here);
        route.directoryStatus = walk.status;
        route.missesDirectory = walk.rest.find_first_not_of('/') != std::string::npos;
    } else {
        route.directory = std::move(walk.directory);
        route.directoryStatus = walk.directoryStatus;
        route.file = walk.status;
    }
    return 0;
}

}  // namespace adminhost
