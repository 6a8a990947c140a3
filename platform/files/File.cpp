#include "platform/files/File.h"

#include "platform/files/FileDescriptor.h"

#include <cerrno>
#include <system_error>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

auto failed(const DiskPath& path, int number) {
    return failure(Error{"posix", number,
                         "cannot read " + hostPath(path).text() + ": " + std::generic_category().message(number)});
}

}  // namespace

Result<std::string> readFile(const DiskPath& path, std::size_t maximum) {
    if (path.text().find('\0') != std::string::npos) {  // the system would open the part before it
        return failed(path, EINVAL);
    }
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return failed(path, errno);
    }
    if (!S_ISREG(status.st_mode)) {
        return failed(path, S_ISDIR(status.st_mode) ? EISDIR : EINVAL);
    }
    std::string bytes;
    std::size_t room = static_cast<std::size_t>(status.st_size) + 1;  // one more, so that growth is noticed
    for (;;) {
        if (bytes.size() > maximum || static_cast<std::size_t>(status.st_size) > maximum) {
            return failed(path, EFBIG);
        }
        const std::size_t used = bytes.size();
        bytes.resize(used + room);
        const ssize_t count = ::read(file.get(), bytes.data() + used, room);
        const std::size_t arrived = count > 0 ? static_cast<std::size_t>(count) : 0;
        bytes.resize(used + arrived);
        if (count == 0) {
            return bytes;
        }
        if (count < 0 && errno != EINTR) {
            return failed(path, errno);
        }
        // The room that is left shows the end; only a file that grows meanwhile needs more.
        room = room > arrived ? room - arrived : 64UL << 10U;
    }
}

}  // namespace adminhost
