#include "platform/files/ReplaceFile.h"

#include "platform/files/FilePlace.h"
#include "platform/text/Hex.h"

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdint>
#include <ctime>
#include <memory>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#include <dirent.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <sys/xattr.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr std::size_t randomDigits = 16;
constexpr const char* accessList = "system.posix_acl_access";

tl::unexpected<Error> failed(std::string_view step, const HostPath& path, int number) {
    return failure(Error{"posix", number,
                         fmt::format("cannot {} {}: {}", step, path.text(), std::generic_category().message(number))});
}

std::string temporaryPrefix(std::string_view name) {
    return fmt::format(".{}.adminhost-", name);
}

/// Removes the files that killed writers of the same file left. A running writer, here or on another machine that
/// shares the directory, holds an exclusive lock on its temporary file. Failures are ignored: they do not affect the
/// coming write.
void removeLeftoversIn(const FilePlace& place) {
    const int copy = ::openat(place.directory.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (copy < 0) {
        return;
    }
    const std::unique_ptr<DIR, int (*)(DIR*)> directory(::fdopendir(copy), &::closedir);
    if (!directory) {
        ::close(copy);
        return;
    }
    const std::string prefix = temporaryPrefix(place.name);
    while (const dirent* entry = ::readdir(directory.get())) {
        const std::string_view name = entry->d_name;
        if (name.size() != prefix.size() + randomDigits || !name.starts_with(prefix) ||
            name.find_first_not_of(lowerHexDigits, prefix.size()) != std::string_view::npos) {
            continue;
        }
        const FileDescriptor leftover(
            ::openat(place.directory.get(), entry->d_name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_CLOEXEC));
        // A shared lock shows that as well, and network file systems give it to a file opened for reading.
        if (leftover.isOpen() && ::flock(leftover.get(), LOCK_SH | LOCK_NB) == 0) {
            ::unlinkat(place.directory.get(), entry->d_name, 0);
        }
    }
}

/// The file for the new bytes; removed again unless it was moved into its place.
class TemporaryFile {
  public:
    explicit TemporaryFile(const FilePlace& place) noexcept : _place(place) {}
    TemporaryFile(const TemporaryFile&) = delete;
    TemporaryFile& operator=(const TemporaryFile&) = delete;
    ~TemporaryFile() {
        if (!_name.empty()) {
            ::unlinkat(_place.directory.get(), _name.c_str(), 0);
        }
    }

    [[nodiscard]] int descriptor() const noexcept { return _file.get(); }

    // Each returns the system's error number, 0 for success.

    int create() {
        for (int attempt = 0; attempt < 100; ++attempt) {
            std::uint64_t random = 0;
            if (::getrandom(&random, sizeof random, 0) != sizeof random) {
                return errno;
            }
            const std::string name = fmt::format("{}{:016x}", temporaryPrefix(_place.name), random);
            _file = FileDescriptor(::openat(_place.directory.get(), name.c_str(),
                                            O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC, 0600));
            if (!_file.isOpen()) {
                if (errno == EEXIST) {
                    continue;
                }
                return errno;
            }
            _name = name;
            // Between creation and lock another writer may have mistaken the file for a leftover. If one holds a lock
            // now, it is about to remove the file.
            struct stat status {};
            ::flock(_file.get(), LOCK_EX);
            if (::fstat(_file.get(), &status) != 0) {
                return errno;
            }
            if (status.st_nlink > 0) {
                return 0;
            }
        }
        return EEXIST;
    }

    int write(std::string_view bytes) noexcept {
        while (!bytes.empty()) {
            const ssize_t count = ::write(_file.get(), bytes.data(), bytes.size());
            if (count > 0) {
                bytes.remove_prefix(static_cast<std::size_t>(count));
            } else if (count == 0) {
                return ENOSPC;
            } else if (errno != EINTR) {
                return errno;
            }
        }
        return 0;
    }

    int flush() noexcept { return ::fsync(_file.get()) == 0 ? 0 : errno; }

    int moveIntoPlace() noexcept {
        // Closed first: some network file systems report a write's failure only then. The second descriptor keeps the
        // lock until the file has its name.
        const FileDescriptor lock(::fcntl(_file.get(), F_DUPFD_CLOEXEC, 0));
        if (!lock.isOpen()) {
            return errno;
        }
        if (const int number = _file.close(); number != 0) {
            return number;
        }
        const int directory = _place.directory.get();
        if (::renameat(directory, _name.c_str(), directory, _place.name.c_str()) != 0) {
            return errno;
        }
        _name.clear();
        return 0;
    }

  private:
    const FilePlace& _place;
    FileDescriptor _file;
    std::string _name;  ///< empty when there is nothing to remove
};

/// An attribute's value, or the system's error number.
int readAttribute(int file, const char* name, std::vector<char>& value) {
    for (;;) {
        const ssize_t size = ::fgetxattr(file, name, nullptr, 0);
        if (size < 0) {
            return errno;
        }
        value.resize(static_cast<std::size_t>(size) + 1);
        const ssize_t count = ::fgetxattr(file, name, value.data(), value.size());
        if (count >= 0) {
            value.resize(static_cast<std::size_t>(count));
            return 0;
        }
        if (errno != ERANGE) {  // ERANGE: it has grown meanwhile
            return errno;
        }
    }
}

bool isUnsupported(int number) noexcept {
    return number == ENOTSUP || number == ENOSYS;
}

/// Copies the attributes of the old file, the access control list among them.
int copyAttributes(int from, int to) {
    std::vector<char> names;
    for (;;) {
        const ssize_t size = ::flistxattr(from, nullptr, 0);
        if (size < 0) {
            return isUnsupported(errno) ? 0 : errno;
        }
        names.resize(static_cast<std::size_t>(size) + 1);
        const ssize_t count = ::flistxattr(from, names.data(), names.size());
        if (count >= 0) {
            names.resize(static_cast<std::size_t>(count));
            break;
        }
        if (errno != ERANGE) {
            return errno;
        }
    }
    bool hasAccessList = false;
    std::vector<char> value;
    for (auto at = names.begin(); at != names.end();) {
        const auto end = std::find(at, names.end(), '\0');
        const std::string name(at, end);
        at = end == names.end() ? end : end + 1;
        // These describe the old bytes, and the system would refuse the new ones by them.
        if (name == "security.ima" || name == "security.evm" || name == "security.capability") {
            continue;
        }
        hasAccessList = hasAccessList || name == accessList;
        int number = readAttribute(from, name.c_str(), value);
        if (number == ENODATA) {
            continue;
        }
        if (number == 0 && ::fsetxattr(to, name.c_str(), value.data(), value.size(), 0) != 0) {
            number = errno;
        }
        const bool isTheSystems = name.starts_with("security.") || name.starts_with("trusted.");
        if (number != 0 && !isUnsupported(number) && !(isTheSystems && (number == EPERM || number == EACCES))) {
            return number;
        }
    }
    // The directory may have given the new file a list that the old one did not have.
    if (!hasAccessList && ::fremovexattr(to, accessList) != 0 && errno != ENODATA && !isUnsupported(errno)) {
        return errno;
    }
    return 0;
}

/// Gives the temporary file all that the old one has besides its bytes.
Result<void> keepProperties(const FileDescriptor& old, const struct stat& status, int temporary, const HostPath& path) {
    struct stat mine {};
    if (::fstat(temporary, &mine) != 0) {
        return failed("look at temporary file for", path, errno);
    }
    if ((mine.st_uid != status.st_uid || mine.st_gid != status.st_gid) &&
        ::fchown(temporary, status.st_uid, status.st_gid) != 0) {
        return failed("keep the owner of", path, errno);
    }
    if (const int number = copyAttributes(old.get(), temporary); number != 0) {
        return failed("keep the attributes of", path, number);
    }
    if (::fchmod(temporary, status.st_mode & 07777U) != 0) {
        return failed("keep the mode of", path, errno);
    }
    return {};
}

/// Opens the file that is to be replaced. It stays empty, without an error, if the file does not exist or is a link.
Result<void> openOld(const FilePlace& place, const HostPath& path, FileDescriptor& old, struct stat& status) {
    if (::fstatat(place.directory.get(), place.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        if (errno == ENOENT) {
            return {};
        }
        return failed("look at", path, errno);
    }
    if (S_ISLNK(status.st_mode)) {
        return {};
    }
    if (!S_ISREG(status.st_mode)) {
        return failed("replace", path, S_ISDIR(status.st_mode) ? EISDIR : EINVAL);
    }
    old = FileDescriptor(
        ::openat(place.directory.get(), place.name.c_str(), O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
    if (!old.isOpen() || ::fstat(old.get(), &status) != 0) {
        return failed("open", path, errno);
    }
    return {};
}

/// Some file systems cannot flush a directory at all, and need not.
int flushDirectory(const FilePlace& place) noexcept {
    return ::fsync(place.directory.get()) == 0 || errno == EINVAL || isUnsupported(errno) ? 0 : errno;
}

/// Gives the file a second name, or moves it to it. Returns the system's error number.
int giveName(const FilePlace& place, const std::string& name) noexcept {
    const int directory = place.directory.get();
    if (::faccessat(directory, place.name.c_str(), R_OK, AT_EACCESS | AT_SYMLINK_NOFOLLOW) == 0 &&
        ::linkat(directory, place.name.c_str(), directory, name.c_str(), 0) == 0) {
        return 0;
    }
    if (errno == EEXIST) {
        return EEXIST;
    }
    return ::renameat2(directory, place.name.c_str(), directory, name.c_str(), RENAME_NOREPLACE) == 0 ? 0 : errno;
}

}  // namespace

Result<void> replaceFile(std::string_view bytes, const HostPath& path, mode_t newMode) {
    FilePlace place;
    if (const int number = openPlace(diskPath(path), place); number != 0) {
        return failed("open the directory of", path, number);
    }
    removeLeftoversIn(place);
    FileDescriptor old;
    struct stat status {};
    if (auto opened = openOld(place, path, old, status); !opened) {
        return opened;
    }
    TemporaryFile temporary(place);
    if (const int number = temporary.create(); number != 0) {
        return failed("create temporary file for", path, number);
    }
    if (const int number = temporary.write(bytes); number != 0) {
        return failed("write temporary file for", path, number);
    }
    if (old.isOpen()) {
        if (auto kept = keepProperties(old, status, temporary.descriptor(), path); !kept) {
            return kept;
        }
    } else if (::fchmod(temporary.descriptor(), newMode) != 0) {
        return failed("set the mode of", path, errno);
    }
    if (const int number = temporary.flush(); number != 0) {
        return failed("flush temporary file for", path, number);
    }
    if (const int number = temporary.moveIntoPlace(); number != 0) {
        return failed("replace", path, number);
    }
    if (const int number = flushDirectory(place); number != 0) {
        auto error = failed("flush the directory after replacing", path, number);
        error.value().domain = notFlushed;
        return error;
    }
    return {};
}

void removeLeftovers(const HostPath& path) {
    FilePlace place;
    if (openPlace(diskPath(path), place) == 0) {
        removeLeftoversIn(place);
    }
}

Result<HostPath> keepUnreadable(const HostPath& path) {
    FilePlace place;
    if (const int number = openPlace(diskPath(path), place); number != 0) {
        return failed("open the directory of", path, number);
    }
    struct stat status {};
    if (::fstatat(place.directory.get(), place.name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
        return failed("look at", path, errno);
    }
    if (!S_ISREG(status.st_mode) && !S_ISLNK(status.st_mode)) {
        return failed("keep the unreadable", path, S_ISDIR(status.st_mode) ? EISDIR : EINVAL);
    }
    const std::time_t now = std::chrono::system_clock::to_time_t(std::chrono::system_clock::now());
    std::tm parts{};
    ::gmtime_r(&now, &parts);
    char moment[32];
    const std::string suffix(moment, std::strftime(moment, sizeof moment, ".unreadable-%Y-%m-%dT%H%M%SZ", &parts));
    for (int attempt = 1; attempt < 1000; ++attempt) {
        const std::string ending = attempt == 1 ? suffix : fmt::format("{}-{}", suffix, attempt);
        const int number = giveName(place, place.name + ending);
        if (number == EEXIST) {
            continue;
        }
        if (number != 0) {
            return failed("keep the unreadable", path, number);
        }
        if (const int flushed = flushDirectory(place); flushed != 0) {
            return failed("flush the directory after keeping", path, flushed);
        }
        return HostPath(path.text() + ending);
    }
    return failed("keep the unreadable", path, EEXIST);
}

}  // namespace adminhost
