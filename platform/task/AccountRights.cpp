#include "platform/task/AccountRights.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <chrono>
#include <fstream>
#include <map>
#include <mutex>
#include <system_error>
#include <utility>

#include <grp.h>
#include <pwd.h>

namespace adminhost {
namespace {

using Clock = std::chrono::steady_clock;

constexpr auto kept = std::chrono::seconds(10);
constexpr uid_t unmappedUser = 65534;  // how the kernel shows an owner that has no id in this user namespace
constexpr gid_t noGroup = 65534;

Result<ChildRights> lookedUp(uid_t user) {
    std::array<char, 65536> buffer;  // not initialised: the C library fills the used part
    passwd entry{};
    passwd* found = nullptr;
    if (const int number = ::getpwuid_r(user, &entry, buffer.data(), buffer.size(), &found); number != 0) {
        return failure(Error{"posix", number, std::generic_category().message(number)});
    }
    if (found == nullptr) {
        return ChildRights{user, noGroup, {}};
    }
    std::vector<gid_t> groups(16);
    int count = static_cast<int>(groups.size());
    while (::getgrouplist(entry.pw_name, entry.pw_gid, groups.data(), &count) < 0) {
        groups.resize(std::max(groups.size() * 2, static_cast<std::size_t>(count)));
        count = static_cast<int>(groups.size());
    }
    groups.resize(static_cast<std::size_t>(count));
    return ChildRights{user, entry.pw_gid, std::move(groups)};
}

/// What this process's user namespace leaves out.
struct Namespace {
    bool hasEveryId = false;
    bool hasTheUnmappedUser = false;

    Namespace() {
        constexpr std::uint64_t all = 0xFFFFFFFF;
        std::ifstream map("/proc/self/uid_map");
        std::uint64_t inside = 0;
        std::uint64_t outside = 0;
        for (std::uint64_t count = 0; map >> inside >> outside >> count;) {
            hasEveryId = hasEveryId || count == all;
            hasTheUnmappedUser = hasTheUnmappedUser || (inside <= unmappedUser && unmappedUser - inside < count);
        }
    }
};

const Namespace& ownNamespace() {
    static const Namespace known;
    return known;
}

}  // namespace

Result<ChildRights> rightsOfAccount(uid_t user) {
    static std::mutex mutex;
    static std::map<uid_t, std::pair<Clock::time_point, ChildRights>> known;
    const std::lock_guard lock(mutex);
    const auto now = Clock::now();
    if (const auto found = known.find(user); found != known.end() && now - found->second.first < kept) {
        return found->second.second;
    }
    auto rights = lookedUp(user);
    if (rights) {
        std::erase_if(known, [&](const auto& entry) { return now - entry.second.first >= kept; });
        known.insert_or_assign(user, std::pair(now, *rights));
    }
    return rights;
}

bool mayCreateFiles(const ChildRights& account, const struct stat& directory) noexcept {
    constexpr mode_t writeAndSearch = 03;
    unsigned shift = 0;
    if (account.user == directory.st_uid) {
        shift = 6;
    } else if (account.group == directory.st_gid ||
               std::find(account.groups.begin(), account.groups.end(), directory.st_gid) != account.groups.end()) {
        shift = 3;
    }
    return ((directory.st_mode >> shift) & writeAndSearch) == writeAndSearch;
}

bool isOfRoot(const struct stat& file) noexcept {
    return file.st_uid == 0 || (file.st_uid == unmappedUser && !ownNamespace().hasTheUnmappedUser);
}

bool isOfRootOrOutside(const struct stat& file) noexcept {
    return file.st_uid == 0 || (file.st_uid == unmappedUser && !ownNamespace().hasEveryId);
}

}  // namespace adminhost
