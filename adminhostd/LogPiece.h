#pragma once

// Reading the service's log files in pieces, as root, in directories that the service's account may write to.
//
// Only regular files are read. A symbolic link is followed only where nobody but root and this process's own user can
// have created it. A file with several names is refused where others may write: anyone could have given a file that
// only root can read another name there.

#include "platform/files/Path.h"
#include "platform/value/Result.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

namespace adminhost {

constexpr std::size_t logPieceMaximum = std::size_t{1} << 20U;  ///< bytes of one piece

/// The file that has a log's name now.
struct LogFileState {
    std::uint64_t inode = 0;
    std::uint64_t size = 0;  ///< bytes
};

/// Returns nullopt if the file does not exist. Fails if it must not or cannot be read: domain "posix", the system's
/// error number, and a description with a suggested fix.
[[nodiscard]] Result<std::optional<LogFileState>> logFileState(const HostPath& path);

struct LogPiece {
    bool missing = false;      ///< no file has the log's name
    std::uint64_t inode = 0;   ///< of the file that the bytes come from; 0: there is none
    std::uint64_t offset = 0;  ///< of the first byte
    std::uint64_t next = 0;    ///< of the byte after the last one: where to go on reading
    std::uint64_t size = 0;    ///< of the file
    bool more = false;         ///< there is more to read at once
    bool gap = false;  ///< what was written after the requested place may be lost: the file was emptied or removed
    std::string bytes;
};

/// Returns what is at the place. The place is in the file with the inode, or in the file that has the log's name now if
/// the inode is 0; an offset behind the end of that one counts as its end. A rotated file is read to its end under its
/// new name, which must begin with the log's name, in the same directory; then the new file follows from its beginning.
/// Fails as logFileState() does, but not if the file does not exist.
[[nodiscard]] Result<LogPiece> readLogPiece(const HostPath& path, std::uint64_t inode, std::uint64_t offset);

}  // namespace adminhost
