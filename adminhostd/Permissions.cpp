#include "adminhostd/Permissions.h"

#include <algorithm>
#include <cerrno>

#include <fmt/format.h>
#include <fmt/ranges.h>
#include <grp.h>
#include <pwd.h>

namespace adminhost {
namespace {

constexpr std::size_t accountRoom = std::size_t{64} << 10U;  ///< bytes of an account's entry
constexpr std::size_t largestRoom = std::size_t{16} << 20U;  ///< a group may have very many members

/// The number of a name, by one of the C library's look-ups; nullopt if it is not found.
template <class Entry, class LookUp, class Number>
std::optional<id_t> numberOf(const std::string& name, LookUp lookUp, Number number) {
    std::vector<char> room(accountRoom);
    Entry entry{};
    Entry* found = nullptr;
    int failure = 0;
    while ((failure = lookUp(name.c_str(), &entry, room.data(), room.size(), &found)) == ERANGE &&
           room.size() < largestRoom) {
        room.resize(room.size() * 4);
    }
    return failure == 0 && found != nullptr ? std::optional<id_t>(entry.*number) : std::nullopt;
}

std::optional<id_t> groupNumber(const std::string& name) {
    return numberOf<group>(name, &::getgrnam_r, &group::gr_gid);
}

}  // namespace

std::optional<uid_t> accountNumberOf(const std::string& name) {
    return numberOf<passwd>(name, &::getpwnam_r, &passwd::pw_uid);
}

std::string_view nameOf(Right right) noexcept {
    return rightWords[static_cast<std::size_t>(right)].first;
}

Right rightFor(Access access) noexcept {
    switch (access) {
        case Access::read:
            return Right::read;
        case Access::write:
            return Right::write;
        case Access::control:
            return Right::control;
        case Access::account:
            break;
    }
    return Right::account;
}

Permissions::Permissions(const std::vector<PermissionOptions>& options, uid_t own, std::string file,
                         const Permissions* former)
    : _own(own), _file(std::move(file)) {
    for (const PermissionOptions& table : options) {
        Grant& grant = _grants.emplace_back(Grant{{}, {}, table.rights});
        const auto resolve = [&](const std::vector<ConfiguredAccount>& accounts, std::string_view kind, auto lookUp,
                                 auto& numbers) {
            for (const ConfiguredAccount& account : accounts) {
                if (account.id) {
                    numbers.push_back(*account.id);
                    continue;
                }
                const std::pair<std::string_view, std::string> name(kind, account.name);
                auto number = lookUp(account.name);
                if (!number && former != nullptr && former->_numbers.contains(name)) {
                    number = former->_numbers.at(name);
                    _kept.push_back(
                        fmt::format("{}: {} not found any more: \"{}\"; its number {} stays in effect until the daemon "
                                    "is restarted: "
                                    "remove the name if the {} was deleted",
                                    account.place, kind, account.name, *number, kind));
                }
                if (number) {
                    numbers.push_back(*number);
                    _numbers.emplace(name, *number);
                } else {
                    _problems.push_back(fmt::format(
                        "{}: {} not found: \"{}\"; create the {}, or correct the name, and reload the daemon",
                        account.place, kind, account.name, kind));
                }
            }
        };
        resolve(table.users, "user", &accountNumberOf, grant.users);
        resolve(table.groups, "group", &groupNumber, grant.groups);
    }
}

Rights Permissions::of(const Peer& peer) const {
    if (isOwn(peer)) {
        return Rights::all();
    }
    Rights rights;
    for (const Grant& grant : _grants) {
        const bool named = std::find(grant.users.begin(), grant.users.end(), peer.uid) != grant.users.end();
        if (named ||
            std::any_of(grant.groups.begin(), grant.groups.end(), [&](gid_t group) { return peer.isInGroup(group); })) {
            rights.add(grant.rights);
        }
    }
    return rights;
}

std::string Permissions::refusal(const Peer& peer, const std::string& name, Right right) const {
    const std::string account = name.empty() ? fmt::format("The account with uid {}", peer.uid)
                                             : fmt::format("The user \"{}\" (uid {})", name, peer.uid);
    const std::string entry = name.empty() ? std::to_string(peer.uid) : '"' + name + '"';
    return fmt::format(
        "{} lacks the class \"{}\", which this needs. To grant it, root adds to {} the lines \"[[permission]]\", "
        "'users = [{}]' and 'classes = [\"{}\"]', and runs \"systemctl reload adminhostd\".",
        account, nameOf(right), _file, entry, nameOf(right));
}

Diagnosis Permissions::check() const {
    if (_grants.empty()) {
        return {Diagnosis::Health::ok, "permissions",
                "Only root and the daemon's account may use the daemon: the configuration grants nothing to others.",
                ""};
    }
    if (_problems.empty() && _kept.empty()) {
        return {Diagnosis::Health::ok, "permissions",
                fmt::format("All users and groups of the {} tables [[permission]] exist.", _grants.size()), ""};
    }
    std::string found;
    if (!_problems.empty()) {
        found = fmt::format("Names in [[permission]] were not found when the daemon read them, and grant nothing: {}.",
                            fmt::join(_problems, "; "));
    }
    if (!_kept.empty()) {
        found += fmt::format(
            "{}Names in [[permission]] were not found when the daemon was reloaded, and keep the numbers that they "
            "had: "
            "{}.",
            found.empty() ? "" : " ", fmt::join(_kept, "; "));
    }
    return {Diagnosis::Health::warning, "permissions", found,
            _problems.empty() ? "remove the names of deleted accounts, or restart the daemon"
                              : "create the accounts or correct the names, and reload the daemon"};
}

}  // namespace adminhost
