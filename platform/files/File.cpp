#include "platform/files/File.h"

#include "platform/files/FileDescriptor.h"

#include <cerrno>
#include <system_error>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

std::nullopt_t fail(const DiskPath& path, int number, Error* error) {
    if (error != nullptr) {
        *error = Error{"posix", number,
                       "cannot read " + hostPath(path).text() + ": " + std::generic_category().message(number)};
    }
    return std::nullopt;
}

}  // namespace

std::optional<std::string> readFile(const DiskPath& path, std::size_t maximum, Error* error) {
    if (path.text().find('\0') != std::string::npos) {  // the system would open what stands before it
        return fail(path, EINVAL, error);
    }
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return fail(path, errno, error);
    }
    if (!S_ISREG(status.st_mode)) {
        return fail(path, S_ISDIR(status.st_mode) ? EISDIR : EINVAL, error);
    }
    std::string bytes;
    std::size_t room = static_cast<std::size_t>(status.st_size) + 1;  // one more, so that growth is noticed
    for (;;) {
        if (bytes.size() > maximum || static_cast<std::size_t>(status.st_size) > maximum) {
            return fail(path, EFBIG, error);
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
            return fail(path, errno, error);
        }
        // What room is left shows the end; only a file that grows meanwhile needs more, and with it another place.
        room = room > arrived ? room - arrived : 64UL << 10U;
    }
}

}  // namespace adminhost
