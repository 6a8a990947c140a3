#include "platform/files/NewFile.h"

#include <cerrno>
#include <string>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <unistd.h>

namespace adminhost {
namespace {

Error systemError(std::string_view step, int number) {
    return {"posix", number, std::string(step) + ": " + std::generic_category().message(number)};
}

bool writeAll(int file, std::string_view bytes) {
    while (!bytes.empty()) {
        const ssize_t count = ::write(file, bytes.data(), bytes.size());
        if (count < 0 && errno != EINTR) {
            return false;
        }
        bytes.remove_prefix(count > 0 ? static_cast<std::size_t>(count) : 0);
    }
    // A network file system may report a full disk only when a descriptor is closed: close a second one. Flushing to
    // the disk would report it too, but can take longer than everything else together.
    const int second = ::fcntl(file, F_DUPFD_CLOEXEC, 0);
    return second >= 0 && ::close(second) == 0;
}

}  // namespace

Result<NewFile> NewFile::create(const DiskPath& path, std::string_view bytes) {
    FilePlace place;
    if (const int number = openPlace(path, place); number != 0) {
        return failure(systemError("cannot open the directory", number));
    }
    const int directory = place.directory.get();
    const char* name = place.name.c_str();
    if (::unlinkat(directory, name, 0) != 0 && errno != ENOENT) {
        return failure(systemError("cannot remove the old file", errno));
    }
    FileDescriptor file(::openat(directory, name, O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0644));
    if (!file.isOpen()) {
        return failure(systemError("cannot create the file", errno));
    }
    if (!writeAll(file.get(), bytes)) {
        const int number = errno;
        static_cast<void>(::unlinkat(directory, name, 0));  // the first failure is the one to report
        return failure(systemError("cannot write the file", number));
    }
    return NewFile(std::move(place), std::move(file));
}

std::optional<Error> NewFile::setOwner(uid_t owner) const {
    if (::fchown(_file.get(), owner, static_cast<gid_t>(-1)) != 0) {
        return systemError("cannot set the owner", errno);
    }
    return std::nullopt;
}

std::optional<Error> NewFile::remove() {
    // Network file systems would keep an open file under another name.
    static_cast<void>(_file.close());
    if (::unlinkat(_place.directory.get(), _place.name.c_str(), 0) != 0) {
        return systemError("cannot remove the file", errno);
    }
    return std::nullopt;
}

}  // namespace adminhost
