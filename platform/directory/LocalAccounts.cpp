#include "platform/directory/LocalAccounts.h"

#include "platform/directory/AccountFiles.h"
#include "platform/directory/KerberosAuthority.h"

#include <algorithm>
#include <charconv>

#include <unicode/ucasemap.h>

namespace adminhost {
namespace {

bool isAscii(std::string_view text) noexcept {
    return std::all_of(text.begin(), text.end(), [](char c) { return static_cast<unsigned char>(c) < 0x80; });
}

char lower(char c) noexcept {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

/// Folds the case of texts, for comparison.
class CaseFolding {
  public:
    CaseFolding() {
        UErrorCode status = U_ZERO_ERROR;
        _map.reset(::ucasemap_open("", U_FOLD_CASE_DEFAULT, &status));
    }

    std::string operator()(std::string_view text) const {
        std::string folded(text.size(), '\0');
        if (isAscii(text) || !_map) {
            std::transform(text.begin(), text.end(), folded.begin(), lower);
            return folded;
        }
        folded.resize(text.size() * 3);  // no character's folding is longer in UTF-8
        UErrorCode status = U_ZERO_ERROR;
        const std::int32_t length =
            ::ucasemap_utf8FoldCase(_map.get(), folded.data(), static_cast<std::int32_t>(folded.size()), text.data(),
                                    static_cast<std::int32_t>(text.size()), &status);
        folded.resize(U_SUCCESS(status) ? static_cast<std::size_t>(length) : 0);
        return U_SUCCESS(status) ? folded : std::string(text);
    }

  private:
    struct Close {
        void operator()(UCaseMap* map) const noexcept { ::ucasemap_close(map); }
    };
    std::unique_ptr<UCaseMap, Close> _map;
};

std::vector<std::string> one(std::string text) {
    return text.empty() ? std::vector<std::string>() : std::vector<std::string>{std::move(text)};
}

/// The accounts of one kind, as the node shows them.
struct Accounts {
    const AccountTable& table;
    AccountKind kind;
    std::string_view realm;  ///< empty: users have no principal
};

std::vector<std::string> valuesOf(const Accounts& accounts, const Account& account, std::string_view attribute) {
    const bool isUser = accounts.kind == AccountKind::user;
    if (attribute == directory::recordName) {
        return one(account.name);
    }
    if (attribute == directory::realName) {
        return one(account.longName);
    }
    if (attribute == directory::generatedUID) {
        return one(accounts.table.uuidTextOf(account).value_or(""));
    }
    if (attribute == directory::uniqueID && isUser) {
        return one(std::to_string(account.id));
    }
    if (attribute == directory::primaryGroupID) {
        return one(std::to_string(account.primaryGroup));
    }
    if (attribute == directory::homeDirectory) {
        return one(account.home);
    }
    if (attribute == directory::userShell) {
        return one(account.shell);
    }
    if (attribute == directory::groupMembership) {
        return account.members;
    }
    if (attribute == directory::authenticationAuthority && isUser && !accounts.realm.empty()) {
        return one(kerberosAuthority(kerberosPrincipalOf(account.name, accounts.realm), accounts.realm).value_or(""));
    }
    return {};
}

/// The number of which this is the decimal text without leading zeros.
std::optional<std::uint32_t> idOf(const std::string& text) {
    std::uint32_t id = 0;
    const char* end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, id);
    return result.ec == std::errc() && result.ptr == end && std::to_string(id) == text ? std::optional(id)
                                                                                       : std::nullopt;
}

void append(std::vector<std::size_t>& positions, const std::vector<std::size_t>& more) {
    positions.insert(positions.end(), more.begin(), more.end());
}

std::vector<std::size_t> scanned(const Accounts& accounts, const DirectoryQuery& query) {
    static const CaseFolding fold;
    const bool whole = query.match == DirectoryQuery::Match::equal;
    std::vector<std::string> wanted = query.values;
    if (!whole) {
        std::transform(wanted.begin(), wanted.end(), wanted.begin(), std::cref(fold));
    }
    const auto matches = [&](const std::string& value) {
        const std::string folded = whole ? std::string() : fold(value);
        return std::any_of(wanted.begin(), wanted.end(),
                           [&](const std::string& w) { return whole ? value == w : folded.starts_with(w); });
    };
    std::vector<std::size_t> positions;
    const std::vector<Account>& all = accounts.table.accounts();
    for (std::size_t i = 0; i < all.size(); ++i) {
        const auto values = valuesOf(accounts, all[i], query.attribute);
        if (std::any_of(values.begin(), values.end(), matches)) {
            positions.push_back(i);
        }
    }
    return positions;
}

/// The positions of the accounts that match, ascending, each once.
std::vector<std::size_t> positionsOf(const Accounts& accounts, const DirectoryQuery& query) {
    const AccountTable& table = accounts.table;
    const std::string& attribute = query.attribute;
    const bool byId =
        attribute == (accounts.kind == AccountKind::user ? directory::uniqueID : directory::primaryGroupID);
    if (query.match != DirectoryQuery::Match::equal ||
        (attribute != directory::generatedUID && attribute != directory::recordName && !byId)) {
        return scanned(accounts, query);
    }
    std::vector<std::size_t> positions;
    for (const std::string& value : query.values) {
        if (attribute == directory::recordName) {
            append(positions, table.named(value));
        } else if (byId) {
            if (const auto id = idOf(value)) {
                append(positions, table.withId(*id));
            }
        } else if (const auto uuid = uuidOf(value)) {
            append(positions, table.withUuid(*uuid));
        }
    }
    std::sort(positions.begin(), positions.end());
    positions.erase(std::unique(positions.begin(), positions.end()), positions.end());
    return positions;
}

class LocalAccountsNode : public DirectoryNode {
  public:
    LocalAccountsNode(std::shared_ptr<AccountFiles> files, std::string realm, std::string name)
        : _name(std::move(name)), _realm(std::move(realm)), _files(std::move(files)) {}

    const std::string& name() const noexcept override { return _name; }

    Result<std::vector<DirectoryRecord>> records(const DirectoryQuery& query) override {
        std::vector<DirectoryRecord> found;
        for (const AccountKind kind : {AccountKind::user, AccountKind::group}) {
            const std::string_view type = kind == AccountKind::user ? directory::users : directory::groups;
            if (std::find(query.recordTypes.begin(), query.recordTypes.end(), type) == query.recordTypes.end()) {
                continue;
            }
            const auto table = _files->table(kind);
            if (!table) {
                return failure(table.error());
            }
            const Accounts accounts{**table, kind, _realm};
            for (const std::size_t position : positionsOf(accounts, query)) {
                if (query.maximum != 0 && found.size() == query.maximum) {
                    return found;
                }
                found.push_back(recordOf(accounts, accounts.table.accounts()[position], query.attributes));
            }
        }
        return found;
    }

    Result<std::vector<DirectoryRecord>> groupsOf(const DirectoryRecord& person,
                                                  const std::vector<std::string>& attributes) override {
        const auto table = _files->table(AccountKind::group);
        if (!table) {
            return failure(table.error());
        }
        const Accounts accounts{**table, AccountKind::group, _realm};
        const std::string* login = person.first(directory::recordName);
        const std::string* primary = person.first(directory::primaryGroupID);
        std::vector<DirectoryRecord> groups;
        for (const Account& group : accounts.table.accounts()) {
            const bool isMember = login != nullptr &&
                                  std::find(group.members.begin(), group.members.end(), *login) != group.members.end();
            if (isMember || (primary != nullptr && std::to_string(group.id) == *primary)) {
                groups.push_back(recordOf(accounts, group, attributes));
            }
        }
        return groups;
    }

  private:
    DirectoryRecord recordOf(const Accounts& accounts, const Account& account,
                             const std::vector<std::string>& attributes) const {
        DirectoryRecord record;
        record.type = accounts.kind == AccountKind::user ? directory::users : directory::groups;
        record.node = _name;
        for (const std::string& attribute : attributes) {
            if (auto values = valuesOf(accounts, account, attribute); !values.empty()) {
                record.attributes.emplace(attribute, std::move(values));
            }
        }
        return record;
    }

    std::string _name;
    std::string _realm;
    std::shared_ptr<AccountFiles> _files;
};

}  // namespace

DirectoryNodeSource localAccounts(std::optional<HostPath> uuidFile, std::string kerberosRealm,
                                  const std::string& name) {
    auto files = std::make_shared<AccountFiles>(std::move(uuidFile));
    return {name, [files, realm = std::move(kerberosRealm), name] {
                return std::make_unique<LocalAccountsNode>(files, realm, name);
            }};
}

}  // namespace adminhost
