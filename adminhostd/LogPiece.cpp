#include "adminhostd/LogPiece.h"

#include "platform/files/FileDescriptor.h"
#include "platform/files/FilePlace.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <climits>
#include <memory>
#include <string_view>
#include <system_error>
#include <utility>

#include <dirent.h>
#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr int mostLinks = 8;  ///< of the last component, one after the other

/// An open log file.
struct OpenLog {
    FileDescriptor file;
    LogFileState state;
};

/// Where the log's files are: the directory, and the name of the present one.
struct LogPlace {
    FilePlace place;
    bool shared = false;  ///< others may create entries in the directory
};

tl::unexpected<Error> refused(const HostPath& path, int number, std::string_view why) {
    return failure({"posix", number, fmt::format("{}: {}", path.text(), why)});
}

tl::unexpected<Error> failed(const HostPath& path, int number) {
    return refused(path, number, std::generic_category().message(number));
}

tl::unexpected<Error> linked(const HostPath& path) {
    return refused(path, ELOOP,
                   "is a link, or behind one, in a directory that others than root may write to; it is not followed; "
                   "name the file itself in the service's configuration, or make the directory writable for root only");
}

/// Opens a regular file of the place. Returns nullopt if nothing has the name. A pipe or device is never opened: that
/// could wait, or have an effect.
Result<std::optional<OpenLog>> opened(const HostPath& path, const LogPlace& log, const std::string& name) {
    const FileDescriptor entry(::openat(log.place.directory.get(), name.c_str(), O_PATH | O_NOFOLLOW | O_CLOEXEC));
    struct stat status {};
    if (!entry.isOpen() || ::fstat(entry.get(), &status) != 0) {
        if (errno == ENOENT) {
            return std::nullopt;
        }
        return failed(path, errno);
    }
    if (S_ISLNK(status.st_mode)) {
        return linked(path);
    }
    if (!S_ISREG(status.st_mode)) {
        return refused(path, EINVAL, "is not a regular file; it is not read");
    }
    if (log.shared && status.st_nlink > 1) {
        return refused(path, EMLINK,
                       "has several names, and others than root may create names in its directory; it is not read; "
                       "remove the other names, or make the directory writable for root only");
    }
    OpenLog opened;
    // The entry itself is opened, whatever has its name by now.
    opened.file =
        FileDescriptor(::open(fmt::format("/proc/self/fd/{}", entry.get()).c_str(), O_RDONLY | O_NOCTTY | O_CLOEXEC));
    if (!opened.file.isOpen()) {
        return failed(path, errno);
    }
    opened.state = {status.st_ino, static_cast<std::uint64_t>(status.st_size)};
    return opened;
}

/// The target of a link; empty if the entry is none.
std::string targetOf(const FilePlace& place) {
    std::array<char, PATH_MAX> target{};
    const ssize_t length = ::readlinkat(place.directory.get(), place.name.c_str(), target.data(), target.size());
    return length < 0 ? std::string() : std::string(target.data(), static_cast<std::size_t>(length));
}

/// Finds the log's place. Returns nullopt if its directory does not exist.
Result<std::optional<LogPlace>> placeOf(const HostPath& path) {
    std::string disk = diskPath(path).text();
    for (int links = 0; links <= mostLinks; ++links) {
        LogPlace log;
        if (const int number = openPlace(DiskPath(disk), log.place); number != 0) {
            if (number == ENOENT) {
                return std::nullopt;
            }
            return number == ELOOP ? linked(path) : failed(path, number);
        }
        struct stat directory {};
        if (::fstat(log.place.directory.get(), &directory) != 0) {
            return failed(path, errno);
        }
        log.shared = othersMayWrite(directory);
        const std::string target = targetOf(log.place);
        if (target.empty() || log.shared) {
            return log;
        }
        disk = target.starts_with('/') ? target : disk.substr(0, disk.rfind('/') + 1) + target;
    }
    return linked(path);
}

Result<std::optional<OpenLog>> current(const HostPath& path, const LogPlace& log) {
    return opened(path, log, log.place.name);
}

struct CloseDirectory {
    void operator()(DIR* directory) const noexcept { ::closedir(directory); }
};

/// The file with this inode, if the directory still has it under a name that begins with the log's.
std::optional<OpenLog> rotated(const HostPath& path, const LogPlace& log, std::uint64_t inode) {
    FileDescriptor again(::openat(log.place.directory.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
    const std::unique_ptr<DIR, CloseDirectory> entries(again.isOpen() ? ::fdopendir(again.get()) : nullptr);
    if (!entries) {
        return std::nullopt;
    }
    static_cast<void>(again.release());
    while (const dirent* entry = ::readdir(entries.get())) {
        if (entry->d_ino == inode && std::string_view(entry->d_name).starts_with(log.place.name)) {
            auto found = opened(path, log, entry->d_name);
            if (found && *found && (*found)->state.inode == inode) {
                return std::move(*found);
            }
        }
    }
    return std::nullopt;
}

Result<LogPiece> pieceOf(const HostPath& path, const OpenLog& log, std::uint64_t offset) {
    LogPiece piece;
    piece.inode = log.state.inode;
    piece.size = log.state.size;
    piece.offset = std::min(offset, piece.size);
    piece.bytes.resize(static_cast<std::size_t>(std::min<std::uint64_t>(piece.size - piece.offset, logPieceMaximum)));
    std::size_t done = 0;
    while (done < piece.bytes.size()) {
        const ssize_t count = ::pread(log.file.get(), piece.bytes.data() + done, piece.bytes.size() - done,
                                      static_cast<off_t>(piece.offset + done));
        if (count < 0 && errno == EINTR) {
            continue;
        }
        if (count < 0) {
            return failed(path, errno);
        }
        if (count == 0) {
            break;  // it was truncated meanwhile
        }
        done += static_cast<std::size_t>(count);
    }
    piece.bytes.resize(done);
    piece.next = piece.offset + done;
    piece.more = done > 0 && piece.next < piece.size;
    return piece;
}

}  // namespace

Result<std::optional<LogFileState>> logFileState(const HostPath& path) {
    const auto place = placeOf(path);
    if (!place) {
        return failure(place.error());
    }
    if (!*place) {
        return std::nullopt;
    }
    const auto log = current(path, **place);
    if (!log) {
        return failure(log.error());
    }
    return *log ? std::optional((*log)->state) : std::nullopt;
}

Result<LogPiece> readLogPiece(const HostPath& path, std::uint64_t inode, std::uint64_t offset) {
    LogPiece none;
    none.missing = true;
    none.inode = inode;
    none.offset = none.next = offset;
    const auto place = placeOf(path);
    if (!place) {
        return failure(place.error());
    }
    if (!*place) {
        return none;
    }
    const auto now = current(path, **place);
    if (!now) {
        return failure(now.error());
    }
    if (*now && (inode == 0 || (*now)->state.inode == inode)) {
        const bool emptied = inode != 0 && offset > (*now)->state.size;
        auto piece = pieceOf(path, **now, emptied ? 0 : offset);
        if (piece) {
            piece->gap = emptied;
        }
        return piece;
    }
    const std::optional<OpenLog> before = inode == 0 ? std::nullopt : rotated(path, **place, inode);
    // While the new file is empty, its writer may still be writing to the old one.
    const bool stays = before && (offset < before->state.size || !*now || (*now)->state.size == 0);
    if (stays) {
        auto piece = pieceOf(path, *before, offset);
        if (piece) {
            piece->more = piece->more || (*now && (*now)->state.size > 0);
        }
        return piece;
    }
    if (!*now) {
        return none;
    }
    auto piece = pieceOf(path, **now, 0);
    if (piece) {
        piece->gap = inode != 0 && !before;
    }
    return piece;
}

}  // namespace adminhost
