#include "platform/files/FileSystem.h"

#include <limits>
#include <string>

#include <fcntl.h>
#include <sys/stat.h>
#include <sys/statvfs.h>

namespace adminhost {
namespace {

/// The system would look at the part before a NUL.
bool hasNul(const DiskPath& path) noexcept {
    return path.text().find('\0') != std::string::npos;
}

}  // namespace

std::optional<std::uint64_t> freeSpaceOf(const DiskPath& path) noexcept {
    struct statvfs status {};
    if (hasNul(path) || ::statvfs(path.c_str(), &status) != 0) {
        return std::nullopt;
    }
    std::uint64_t bytes = 0;
    // Some network file systems report more blocks than their bytes fit into 64 bits.
    return __builtin_mul_overflow(status.f_bavail, status.f_frsize, &bytes) ? std::numeric_limits<std::uint64_t>::max()
                                                                            : bytes;
}

std::optional<Date> creationDateOf(const DiskPath& path) noexcept {
    struct statx status {};
    if (hasNul(path) || ::statx(AT_FDCWD, path.c_str(), 0, STATX_BTIME | STATX_MTIME, &status) != 0) {
        return std::nullopt;
    }
    const statx_timestamp& time = (status.stx_mask & STATX_BTIME) != 0 ? status.stx_btime : status.stx_mtime;
    return Date(std::chrono::seconds(time.tv_sec));
}

bool isDirectory(const DiskPath& path) noexcept {
    struct stat status {};
    return !hasNul(path) && ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

}  // namespace adminhost
