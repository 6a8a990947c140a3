#include "adminhostctl/SecretFile.h"

#include "platform/files/FileDescriptor.h"

#include <cerrno>
#include <cstring>
#include <string_view>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost::ctl {
namespace {

constexpr std::size_t maximumSize = std::size_t{64} << 10U;

tl::unexpected<Error> unusable(const std::string& path, std::string_view why) {
    return failure({"file", 1, path + ": " + std::string(why)});
}

}  // namespace

Result<std::string> secretOfFile(const std::string& path) {
    // A pipe is not waited for.
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return unusable(path, std::strerror(errno));
    }
    if (!S_ISREG(status.st_mode)) {
        return unusable(path, "not a regular file");
    }
    if ((status.st_mode & 077U) != 0) {
        return unusable(path, "group or others have access; set its mode to 0600");
    }
    std::string bytes(maximumSize + 1, '\0');
    const ssize_t size = ::read(file.get(), bytes.data(), bytes.size());
    if (size < 0) {
        return unusable(path, std::strerror(errno));
    }
    bytes.resize(static_cast<std::size_t>(size));
    if (bytes.size() > maximumSize) {
        return unusable(path, "larger than 64 KiB");
    }
    for (const char end : {'\n', '\r'}) {
        if (bytes.ends_with(end)) {
            bytes.pop_back();
        }
    }
    if (bytes.empty()) {
        return unusable(path, "the file is empty");
    }
    return bytes;
}

}  // namespace adminhost::ctl
