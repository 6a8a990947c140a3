#include "adminhostd/Login.h"

#include <array>
#include <charconv>
#include <fstream>
#include <iterator>
#include <optional>

#include <fmt/format.h>
#include <pwd.h>

namespace adminhost {
namespace {

/// The value that the kernel shows for a process that no login session started.
constexpr uid_t noSession = static_cast<uid_t>(-1);

std::optional<uid_t> sessionOf(pid_t pid) {
    std::ifstream file(fmt::format("/proc/{}/loginuid", pid));
    const std::string text(std::istreambuf_iterator<char>(file), {});
    uid_t uid = noSession;
    const auto [end, failure] = std::from_chars(text.data(), text.data() + text.size(), uid);
    return failure == std::errc() && uid != noSession ? std::optional(uid) : std::nullopt;
}

std::string accountText(uid_t uid) {
    std::array<char, 4096> room{};
    passwd account{};
    passwd* found = nullptr;
    if (::getpwuid_r(uid, &account, room.data(), room.size(), &found) != 0 || found == nullptr) {
        return fmt::format("uid {}", uid);
    }
    return fmt::format("{} (uid {})", found->pw_name, uid);
}

}  // namespace

std::string loginText(uid_t uid, pid_t pid) {
    const uid_t login = sessionOf(pid).value_or(uid);
    return login == uid ? accountText(uid) : accountText(login) + ", as " + accountText(uid);
}

}  // namespace adminhost
