#include "platform/log/StandardError.h"

#include "platform/files/FileDescriptor.h"

#include <algorithm>
#include <cerrno>
#include <climits>
#include <cstddef>
#include <cstdlib>

#include <fcntl.h>
#include <fmt/format.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

/// A pipe or terminal opened a second time, because O_NONBLOCK on the shared description would hold for every process
/// that has it.
class SecondOpening {
  public:
    /// A descriptor for the present standard error; -1 when it cannot be opened.
    int of(const struct stat& status) {
        if (status.st_dev != _device || status.st_ino != _inode) {
            _descriptor = FileDescriptor(::open("/proc/self/fd/2", O_WRONLY | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
            _device = status.st_dev;
            _inode = status.st_ino;
        }
        return _descriptor.get();
    }

  private:
    FileDescriptor _descriptor;
    dev_t _device = 0;
    ino_t _inode = 0;
};

/// For an output that cannot be opened a second time: writes only so much that a pipe with any room accepts it.
ssize_t writeCarefully(std::string_view text) {
    pollfd entry{STDERR_FILENO, POLLOUT, 0};
    if (::poll(&entry, 1, 0) != 1) {
        errno = EAGAIN;
        return -1;
    }
    return ::write(STDERR_FILENO, text.data(), std::min<std::size_t>(text.size(), PIPE_BUF));
}

}  // namespace

QueuedSink::Written writeToStandardError(std::string_view text) {
    static auto& second = *new SecondOpening;
    struct stat status {};
    if (::fstat(STDERR_FILENO, &status) != 0) {
        return {QueuedSink::Outcome::failed};
    }
    const bool socket = S_ISSOCK(status.st_mode);
    const bool mayBlock = S_ISFIFO(status.st_mode) || S_ISCHR(status.st_mode);
    const int nonBlocking = mayBlock ? second.of(status) : -1;
    std::size_t done = 0;
    while (done < text.size()) {
        const std::string_view left = text.substr(done);
        const ssize_t count = socket      ? ::send(STDERR_FILENO, left.data(), left.size(), MSG_DONTWAIT | MSG_NOSIGNAL)
                              : !mayBlock ? ::write(STDERR_FILENO, left.data(), left.size())
                              : nonBlocking >= 0 ? ::write(nonBlocking, left.data(), left.size())
                                                 : writeCarefully(left);
        if (count >= 0) {
            done += static_cast<std::size_t>(count);
        } else if (errno == EAGAIN || errno == ENOBUFS) {
            return {QueuedSink::Outcome::later, done};
        } else if (errno != EINTR) {
            return {QueuedSink::Outcome::failed};
        }
    }
    return {QueuedSink::Outcome::written};
}

bool standardErrorIsTheJournal() {
    struct stat status {};
    const char* const stream = std::getenv("JOURNAL_STREAM");  // "DEVICE:INODE"
    return stream != nullptr && ::fstat(STDERR_FILENO, &status) == 0 &&
           fmt::format("{}:{}", status.st_dev, status.st_ino) == stream;
}

}  // namespace adminhost
