#include "platform/directory/AccountFiles.h"

#include "platform/directory/CarriedText.h"
#include "platform/directory/NameBasedUuid.h"
#include "platform/files/File.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <ctime>

#include <grp.h>
#include <pwd.h>
#include <sys/stat.h>

namespace adminhost {
namespace {

constexpr std::size_t maximumFileSize = std::size_t{64} << 20U;  ///< bytes
/// A longer line is skipped. A group's line holds all its members, and while it is read, a pointer for each of them.
constexpr std::size_t maximumLine = std::size_t{16} << 20U;
/// A file system stamps changes with a clock of this resolution at worst, in nanoseconds (it ticks 100 times a second).
constexpr std::int64_t stampResolution = 20'000'000;

const HostPath usersFile("/etc/passwd");
const HostPath groupsFile("/etc/group");

struct CloseFile {
    void operator()(std::FILE* file) const noexcept { static_cast<void>(std::fclose(file)); }
};
using File = std::unique_ptr<std::FILE, CloseFile>;

std::int64_t nanosecondsOf(const timespec& time) noexcept {
    return static_cast<std::int64_t>(time.tv_sec) * 1'000'000'000 + time.tv_nsec;
}

/// Names are keys: a repaired one would name another account, so such an account is left out. Lines that begin with
/// "+" or "-" are directions to the name service, not accounts.
bool isAccountName(const char* name) noexcept {
    return name != nullptr && name[0] != '\0' && name[0] != '+' && name[0] != '-' && isCarriedText(name);
}

/// The full name: the first field of the comment, in which "&" means the login, capitalised.
std::string longNameOf(const char* comment, std::string_view login) {
    std::string_view field = comment == nullptr ? "" : comment;
    field = field.substr(0, field.find(','));
    std::string name;
    for (const char c : field) {
        if (c != '&') {
            name += c;
            continue;
        }
        const std::size_t at = name.size();
        name += login;
        if (name[at] >= 'a' && name[at] <= 'z') {
            name[at] = static_cast<char>(name[at] - 'a' + 'A');
        }
    }
    return carriedTextOf(name);
}

Account accountOf(const passwd& entry) {
    Account account;
    account.name = entry.pw_name;
    account.longName = longNameOf(entry.pw_gecos, account.name);
    account.home = carriedTextOf(entry.pw_dir == nullptr ? "" : entry.pw_dir);
    account.shell = carriedTextOf(entry.pw_shell == nullptr ? "" : entry.pw_shell);
    account.id = entry.pw_uid;
    account.primaryGroup = entry.pw_gid;
    return account;
}

Account accountOf(const group& entry) {
    Account account;
    account.name = entry.gr_name;
    account.id = entry.gr_gid;
    account.primaryGroup = entry.gr_gid;
    for (char** member = entry.gr_mem; member != nullptr && *member != nullptr; ++member) {
        if (isAccountName(*member)) {
            account.members.emplace_back(*member);
        }
    }
    return account;
}

const char* nameOf(const passwd& entry) noexcept {
    return entry.pw_name;
}
const char* nameOf(const group& entry) noexcept {
    return entry.gr_name;
}

void skipLine(std::FILE* file) {
    for (int c = std::fgetc(file); c != EOF && c != '\n'; c = std::fgetc(file)) {
    }
}

/// All accounts that the C library's reader finds in the text; it skips lines that are not accounts.
template <class Entry>
std::vector<Account> accountsIn(std::string& text, int (*next)(std::FILE*, Entry*, char*, std::size_t, Entry**)) {
    std::vector<Account> accounts;
    if (text.empty()) {
        return accounts;
    }
    const File file(::fmemopen(text.data(), text.size(), "r"));
    if (!file) {
        throw std::bad_alloc();
    }
    std::vector<char> buffer(4096);
    while (true) {
        Entry entry{};
        Entry* found = nullptr;
        const int status = next(file.get(), &entry, buffer.data(), buffer.size(), &found);
        if (status == 0 && found != nullptr) {
            if (isAccountName(nameOf(entry))) {
                accounts.push_back(accountOf(entry));
            }
        } else if (status == ERANGE && buffer.size() < maximumLine) {
            buffer.resize(buffer.size() * 2);  // the reader is at the line's beginning again
        } else if (status == ERANGE) {
            skipLine(file.get());
        } else {
            return accounts;  // the end
        }
    }
}

GivenUuids givenUuidsIn(std::string_view text) {
    constexpr std::string_view blanks = " \t\r";
    GivenUuids given;
    while (!text.empty()) {
        const std::size_t end = std::min(text.find('\n'), text.size());
        std::string_view line = text.substr(0, end);
        text.remove_prefix(std::min(end + 1, text.size()));
        line.remove_prefix(std::min(line.find_first_not_of(blanks), line.size()));
        line = line.substr(0, line.find_last_not_of(blanks) + 1);
        const std::size_t gap = line.find_last_of(blanks);
        if (line.starts_with('#') || gap == std::string_view::npos) {
            continue;
        }
        const std::string_view uuid = line.substr(gap + 1);
        const std::string_view name = line.substr(0, line.find_last_not_of(blanks, gap) + 1);
        if (uuidOf(uuid) && (name.starts_with("user:") || name.starts_with("group:"))) {
            given.try_emplace(std::string(name), uuid);
        }
    }
    return given;
}

std::string qualifiedName(AccountKind kind, std::string_view name) {
    std::string text = kind == AccountKind::user ? "user:" : "group:";
    text += name;
    return text;
}

template <class Key>
std::vector<std::size_t> positionsOf(const std::vector<std::pair<Key, std::size_t>>& index, const Key& key) {
    std::vector<std::size_t> positions;
    for (auto at = std::lower_bound(index.begin(), index.end(), std::pair(key, std::size_t{0}));
         at != index.end() && at->first == key; ++at) {
        positions.push_back(at->second);
    }
    return positions;
}

}  // namespace

AccountTable::AccountTable(AccountKind kind, std::vector<Account> accounts, std::shared_ptr<const GivenUuids> given)
    : _kind(kind), _given(std::move(given)) {
    // If several lines have the same name, the C library only ever returns the first.
    _accounts.reserve(accounts.size());
    _byName.reserve(accounts.size());
    _byId.reserve(accounts.size());
    for (Account& account : accounts) {
        if (_byName.contains(account.name)) {
            continue;
        }
        const std::size_t position = _accounts.size();
        _byId.emplace_back(account.id, position);
        _accounts.push_back(std::move(account));
        _byName.emplace(_accounts.back().name, position);
    }
    std::sort(_byId.begin(), _byId.end());
}

std::vector<std::size_t> AccountTable::named(std::string_view name) const {
    const auto found = _byName.find(name);
    return found == _byName.end() ? std::vector<std::size_t>() : std::vector<std::size_t>{found->second};
}

std::vector<std::size_t> AccountTable::withId(std::uint32_t id) const {
    return positionsOf(_byId, id);
}

std::vector<std::size_t> AccountTable::withUuid(const Uuid& uuid) const {
    if (!_byUuid) {
        auto& index = _byUuid.emplace();
        index.reserve(_accounts.size());
        for (std::size_t i = 0; i < _accounts.size(); ++i) {
            if (!_given) {
                index.emplace_back(nameBasedUuid(localAccountsNamespace, qualifiedName(_kind, _accounts[i].name)), i);
            } else if (const auto text = uuidTextOf(_accounts[i])) {
                index.emplace_back(uuidOf(*text).value_or(Uuid{}), i);
            }
        }
        std::sort(index.begin(), index.end());
    }
    return positionsOf(*_byUuid, uuid);
}

std::optional<std::string> AccountTable::uuidTextOf(const Account& account) const {
    const std::string name = qualifiedName(_kind, account.name);
    if (!_given) {
        return textOf(nameBasedUuid(localAccountsNamespace, name));
    }
    const auto found = _given->find(name);
    return found == _given->end() ? std::nullopt : std::optional(found->second);
}

bool AccountFiles::Identity::same(const Identity& now) const noexcept {
    return settled && inode != 0 && device == now.device && inode == now.inode && size == now.size &&
           modified == now.modified && changed == now.changed;
}

AccountFiles::Identity AccountFiles::identityOf(const DiskPath& path) noexcept {
    struct stat status {};
    timespec now{};
    if (::stat(path.c_str(), &status) != 0 || ::clock_gettime(CLOCK_REALTIME, &now) != 0) {
        return {};
    }
    Identity identity;
    identity.device = status.st_dev;
    identity.inode = status.st_ino;
    identity.size = status.st_size;
    identity.modified = nanosecondsOf(status.st_mtim);
    identity.changed = nanosecondsOf(status.st_ctim);
    identity.settled = std::abs(nanosecondsOf(now) - identity.changed) > stampResolution;
    return identity;
}

bool AccountFiles::unchanged(const Kept& kept, const DiskPath& path) const noexcept {
    return kept.path == path.text() && kept.identity.same(identityOf(path));
}

Result<std::shared_ptr<const AccountTable>> AccountFiles::table(AccountKind kind) {
    const std::size_t slot = kind == AccountKind::user ? 0 : 1;
    if (_uuidFile) {
        const DiskPath path = diskPath(*_uuidFile);
        if (!_given || !unchanged(_keptUuids, path)) {
            _given.reset();
            _tables[0].reset();
            _tables[1].reset();
            _keptUuids = {path.text(),
                          identityOf(path)};  // before reading: a change meanwhile shows at the next look-up
            const auto text = readFile(path, maximumFileSize);
            if (!text) {
                return failure(text.error());
            }
            _given = std::make_shared<const GivenUuids>(givenUuidsIn(*text));
        }
    }
    const DiskPath path = diskPath(kind == AccountKind::user ? usersFile : groupsFile);
    if (!_tables[slot] || !unchanged(_keptAccounts[slot], path)) {
        _tables[slot].reset();
        _keptAccounts[slot] = {path.text(), identityOf(path)};
        auto text = readFile(path, maximumFileSize);
        if (!text) {
            return failure(text.error());
        }
        ++_passes;
        _tables[slot] =
            std::make_shared<const AccountTable>(kind,
                                                 kind == AccountKind::user ? accountsIn<passwd>(*text, ::fgetpwent_r)
                                                                           : accountsIn<group>(*text, ::fgetgrent_r),
                                                 _given);
    }
    return _tables[slot];
}

}  // namespace adminhost
