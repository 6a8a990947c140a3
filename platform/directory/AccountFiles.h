#pragma once

// The account files of this machine, read whole and indexed.
//
// A table is read once and kept as long as its files are the same files with the same content. All look-ups of a
// request therefore share one pass over the accounts, however many they are. Every look-up checks the files again. A
// file that changed within the clock's resolution of being read is read again.

#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/text/Uuid.h"
#include "platform/value/Result.h"

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <unordered_map>
#include <utility>
#include <vector>

namespace adminhost {

enum class AccountKind { user, group };

/// One line of an account file. A property list can carry all of its texts.
struct ADMINHOST_EXPORT Account {
    std::string name;
    std::string longName;  ///< empty if there is none, and for groups
    std::string home;
    std::string shell;
    std::uint32_t id = 0;            ///< user id of a user, group id of a group
    std::uint32_t primaryGroup = 0;  ///< group id of either
    std::vector<std::string> members;
};

/// UUIDs from a file of lines "user:NAME UUID" and "group:NAME UUID". If a name occurs twice, its first line counts.
using GivenUuids = std::unordered_map<std::string, std::string>;

/// The accounts of one kind, in file order; names are unique. Not copyable or movable, because indexes point into it.
class ADMINHOST_EXPORT AccountTable {
  public:
    AccountTable(AccountKind kind, std::vector<Account> accounts, std::shared_ptr<const GivenUuids> given);
    AccountTable(const AccountTable&) = delete;
    AccountTable& operator=(const AccountTable&) = delete;
    ~AccountTable() = default;

    [[nodiscard]] const std::vector<Account>& accounts() const noexcept { return _accounts; }

    // Positions in accounts(), ascending.
    [[nodiscard]] std::vector<std::size_t> named(std::string_view name) const;
    [[nodiscard]] std::vector<std::size_t> withId(std::uint32_t id) const;
    [[nodiscard]] std::vector<std::size_t> withUuid(const Uuid& uuid) const;

    /// The UUID as it is to be shown: as the file of UUIDs spells it, or the name-based one. Returns nullopt if there
    /// is a file of UUIDs and the account is missing in it.
    [[nodiscard]] std::optional<std::string> uuidTextOf(const Account& account) const;

  private:
    AccountKind _kind;
    std::vector<Account> _accounts;
    std::shared_ptr<const GivenUuids> _given;  ///< null: name-based
    std::unordered_map<std::string_view, std::size_t> _byName;
    std::vector<std::pair<std::uint32_t, std::size_t>> _byId;
    mutable std::optional<std::vector<std::pair<Uuid, std::size_t>>> _byUuid;  ///< built by the first look-up
};

class ADMINHOST_EXPORT AccountFiles {
  public:
    /// If there is a file of UUIDs, only accounts named in it have a UUID.
    explicit AccountFiles(std::optional<HostPath> uuidFile = std::nullopt) : _uuidFile(std::move(uuidFile)) {}

    /// The accounts below the system root as they are now: /etc/passwd or /etc/group. Never null. Fails if a file
    /// cannot be read.
    [[nodiscard]] Result<std::shared_ptr<const AccountTable>> table(AccountKind kind);

    /// The number of passes over account files so far.
    [[nodiscard]] std::size_t passes() const noexcept { return _passes; }

  private:
    struct Identity {
        std::uint64_t device = 0;
        std::uint64_t inode = 0;
        std::int64_t size = 0;
        std::int64_t modified = 0;  ///< nanoseconds
        std::int64_t changed = 0;   ///< nanoseconds
        bool settled = false;       ///< the last change is old enough for a later one to show
        [[nodiscard]] bool same(const Identity& now) const noexcept;
    };
    struct Kept {
        std::string path;
        Identity identity;
    };
    [[nodiscard]] static Identity identityOf(const DiskPath& path) noexcept;
    [[nodiscard]] bool unchanged(const Kept& kept, const DiskPath& path) const noexcept;

    std::optional<HostPath> _uuidFile;
    Kept _keptUuids;
    std::shared_ptr<const GivenUuids> _given;
    Kept _keptAccounts[2];
    std::shared_ptr<const AccountTable> _tables[2];
    std::size_t _passes = 0;
};

}  // namespace adminhost
