#include "adminhostd/WriteLock.h"

#include "platform/files/CreateMissing.h"
#include "platform/files/Path.h"

#include <array>
#include <cerrno>
#include <charconv>
#include <string>
#include <string_view>
#include <system_error>

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr const char* runDirectory = "/run/adminhostd";
constexpr const char* lockDirectory = "/run/adminhostd/private";
constexpr const char* lockFile = "write.lock";

tl::unexpected<Error> unusable(const std::string& reason) {
    return failure(Error{"posix", errno,
                         fmt::format("The lock for changes {}/{} cannot be used: {}.",
                                     diskPath(HostPath(lockDirectory)).text(), lockFile, reason)});
}

tl::unexpected<Error> unusable() {
    return unusable(std::generic_category().message(errno));
}

/// The directory, which is created if it is missing, and closed to other accounts.
Result<FileDescriptor> privateDirectory() {
    const OwnerAndMode forAll{::geteuid(), ::getegid(), 0755};
    const OwnerAndMode forUs{::geteuid(), ::getegid(), 0700};
    const DiskPath path = diskPath(HostPath(lockDirectory));
    for (const auto& created :
         {createDirectories(diskPath(HostPath(runDirectory)), forAll), createDirectories(path, forUs)}) {
        if (!created) {
            errno = static_cast<int>(created.error().code);
            return unusable(created.error().description.value_or(""));
        }
    }
    FileDescriptor directory(::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC));
    struct stat status {};
    if (!directory.isOpen() || ::fstat(directory.get(), &status) != 0) {
        return unusable();
    }
    if (status.st_uid != ::geteuid()) {
        errno = EPERM;
        return unusable(
            fmt::format("its directory belongs to the account {}; change its owner to {}", status.st_uid, ::geteuid()));
    }
    if ((status.st_mode & (S_IRWXG | S_IRWXO)) != 0 && ::fchmod(directory.get(), S_IRWXU) != 0) {
        return unusable();
    }
    return directory;
}

/// The holder's process id, as it has written it; empty if it has not yet.
std::string holderOf(int file) {
    std::array<char, 16> text{};
    const ssize_t length = ::pread(file, text.data(), text.size(), 0);
    pid_t pid = 0;
    if (length <= 0 || std::from_chars(text.data(), text.data() + length, pid).ec != std::errc()) {
        return {};
    }
    return std::to_string(pid);
}

}  // namespace

WriteLock::Held::~Held() {
    if (_file.isOpen()) {
        static_cast<void>(::ftruncate(_file.get(), 0) == 0);  // the number would be out of date
    }
}

Result<WriteLock::Held> WriteLock::tryToHold() {
    const auto directory = privateDirectory();
    if (!directory) {
        return failure(directory.error());
    }
    FileDescriptor file(
        ::openat(directory->get(), lockFile, O_RDWR | O_CREAT | O_NOFOLLOW | O_CLOEXEC, S_IRUSR | S_IWUSR));
    if (!file.isOpen() && errno == EROFS) {
        file = FileDescriptor(::openat(directory->get(), lockFile, O_RDONLY | O_NOFOLLOW | O_CLOEXEC));
    }
    if (!file.isOpen()) {
        return unusable();
    }
    while (::flock(file.get(), LOCK_EX | LOCK_NB) != 0) {
        if (errno == EWOULDBLOCK) {
            const std::string holder = holderOf(file.get());
            return failure(Error{busy, EWOULDBLOCK,
                                 fmt::format("Another process{} is changing something and has not finished.",
                                             holder.empty() ? "" : " (" + holder + ")")});
        }
        if (errno != EINTR) {
            return unusable();
        }
    }
    const std::string self = std::to_string(::getpid()) + "\n";
    if (::ftruncate(file.get(), 0) != 0 ||
        ::pwrite(file.get(), self.data(), self.size(), 0) != static_cast<ssize_t>(self.size())) {
        // On a full or read-only disk other processes do not see which one holds the lock. It is held all the same.
    }
    return Held(std::move(file));
}

}  // namespace adminhost
