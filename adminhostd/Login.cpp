#include "adminhostd/Login.h"

#include "platform/files/FileDescriptor.h"

#include <array>
#include <charconv>
#include <cstdio>

#include <fcntl.h>
#include <fmt/format.h>
#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

std::string accountText(uid_t uid) {
    const std::string name = accountNameOf(uid);
    return name.empty() ? fmt::format("uid {}", uid) : fmt::format("{} (uid {})", name, uid);
}

}  // namespace

uid_t loginOf(pid_t pid, uid_t uid) noexcept {
    std::array<char, 32> path{};
    static_cast<void>(std::snprintf(path.data(), path.size(), "/proc/%d/loginuid", static_cast<int>(pid)));
    const FileDescriptor file(::open(path.data(), O_RDONLY | O_CLOEXEC));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0 || (status.st_uid != uid && status.st_uid != 0)) {
        return noLogin;
    }
    std::array<char, 16> text{};
    const ssize_t size = ::read(file.get(), text.data(), text.size());
    uid_t login = noLogin;
    const bool parsed = size > 0 && std::from_chars(text.data(), text.data() + size, login).ec == std::errc();
    return parsed ? login : noLogin;
}

std::string accountNameOf(uid_t uid) {
    std::array<char, 4096> room{};
    passwd account{};
    passwd* found = nullptr;
    const bool known = ::getpwuid_r(uid, &account, room.data(), room.size(), &found) == 0 && found != nullptr;
    return known ? found->pw_name : std::string();
}

std::string loginText(uid_t uid, uid_t login) {
    return login == noLogin || login == uid ? accountText(uid) : accountText(login) + ", as " + accountText(uid);
}

}  // namespace adminhost
