#include "platform/directory/LdapQuery.h"

#include "platform/directory/LdapFilter.h"
#include "platform/directory/LdapMembers.h"
#include "platform/directory/LdapRecord.h"

#include <algorithm>
#include <array>
#include <map>
#include <set>
#include <span>
#include <unordered_set>

namespace adminhost {
namespace {

/// Below the 500 at which slapd stops by default, and the 1000 of other servers.
constexpr std::size_t pageSize = 200;

/// The values that are worth asking for, each once. UUIDs are the same in either case; others are as given.
std::vector<std::string> distinctValues(const DirectoryQuery& query) {
    std::vector<std::string> distinct;
    std::unordered_set<std::string> seen;
    const bool isUuid = query.attribute == directory::generatedUID && query.match == DirectoryQuery::Match::equal;
    for (const std::string& value : query.values) {
        const auto uuid = isUuid ? uuidOf(value) : std::nullopt;
        if (isUuid && !uuid) {
            continue;
        }
        if (seen.insert(uuid ? textOf(*uuid) : value).second) {
            distinct.push_back(value);
        }
    }
    return distinct;
}

bool isUnique(std::string_view attribute) noexcept {
    return attribute == directory::generatedUID || attribute == directory::recordName ||
           attribute == directory::uniqueID;
}

class Query {
  public:
    Query(LdapConnection& connection, const LdapMapping& mapping, const std::string& node, const DirectoryQuery& query)
        : _connection(connection), _mapping(mapping), _node(node), _query(query) {
        for (const AccountKind kind : {AccountKind::user, AccountKind::group}) {
            const std::string_view type = kind == AccountKind::user ? directory::users : directory::groups;
            if (std::find(query.recordTypes.begin(), query.recordTypes.end(), type) != query.recordTypes.end()) {
                _kinds.push_back(kind);
            }
        }
        _wantsMembers = std::find(query.attributes.begin(), query.attributes.end(), directory::groupMembership) !=
                        query.attributes.end();
        // A few entries for each value need no pages, and two searches can be on their way at once.
        _paged = query.match != DirectoryQuery::Match::equal || !isUnique(query.attribute);
    }

    [[nodiscard]] Result<std::vector<DirectoryRecord>> run() {
        const std::vector<std::string> values = distinctValues(_query);
        for (std::size_t begin = 0; begin < values.size() && !isFull(); begin += ldapValuesInOneSearch) {
            const std::size_t count = std::min(ldapValuesInOneSearch, values.size() - begin);
            if (auto searched = lookUp(std::span(values).subspan(begin, count)); !searched) {
                return failure(searched.error());
            }
        }
        if (auto completed = completeMembers(); !completed) {
            return failure(completed.error());
        }
        std::vector<DirectoryRecord> all;
        all.reserve(count());
        for (const AccountKind kind : _kinds) {
            for (auto& [dn, record] : found(kind)) {
                all.push_back(std::move(record));
            }
        }
        return all;
    }

  private:
    using Found = std::map<std::string, DirectoryRecord, std::less<>>;

    [[nodiscard]] Found& found(AccountKind kind) noexcept { return _found[kind == AccountKind::user ? 0 : 1]; }
    [[nodiscard]] std::size_t count() const noexcept { return _found[0].size() + _found[1].size(); }
    [[nodiscard]] bool isFull() const noexcept { return _query.maximum != 0 && count() >= _query.maximum; }

    void add(AccountKind kind, const LdapEntry& entry) {
        // An entry that is both a user and a group is a user.
        if (kind == AccountKind::group && found(AccountKind::user).contains(entry.dn)) {
            return;
        }
        auto record = ldapRecordOf(_mapping, kind, _node, entry, _query.attributes);
        if (!record || !found(kind).try_emplace(entry.dn, *std::move(record)).second) {
            return;
        }
        if (kind == AccountKind::group && _wantsMembers) {
            _groups.push_back(entry);
        }
    }

    /// Adds the members that groups list by DN, once no other search is under way.
    [[nodiscard]] Result<void> completeMembers() {
        for (const LdapEntry& group : _groups) {
            const auto members = ldapMembersByDn(_connection, _mapping, group);
            if (!members) {
                return failure(members.error());
            }
            if (!members->empty()) {
                auto& all = found(AccountKind::group).at(group.dn).attributes[std::string(directory::groupMembership)];
                all.insert(all.end(), members->begin(), members->end());
            }
        }
        return {};
    }

    [[nodiscard]] LdapEntrySink sinkFor(AccountKind kind) {
        return [this, kind](const LdapEntry& entry) {
            add(kind, entry);
            return !isFull();
        };
    }

    [[nodiscard]] std::optional<LdapSearch> searchFor(AccountKind kind, std::span<const std::string> values) const {
        auto matching = _mapping.matching(kind, _query.attribute, _query.match, values);
        if (!matching) {
            return std::nullopt;
        }
        LdapSearch search;
        search.base = _mapping.base(kind);
        search.filter = filterAll(std::array{*std::move(matching), _mapping.filter(kind)});
        search.attributes = _mapping.needed(kind, _query.attributes);
        if (_paged) {
            search.pageSize = _query.maximum == 0 ? pageSize : std::min(pageSize, _query.maximum);
        }
        return search;
    }

    [[nodiscard]] Result<void> lookUp(std::span<const std::string> values) {
        const bool both = _kinds.size() == 2 && !_paged && _query.maximum == 0;
        if (both && _mapping.isOneSearch()) {
            const auto told = lookUpInOne(values);
            if (!told) {
                return failure(told.error());
            }
            if (*told) {
                return {};
            }
        }
        std::vector<std::pair<AccountKind, LdapSearch>> searches;
        for (const AccountKind kind : _kinds) {
            if (auto search = searchFor(kind, values)) {
                searches.emplace_back(kind, *std::move(search));
            }
        }
        if (both && searches.size() == 2) {
            return _connection.searchBoth(searches[0].second, sinkFor(searches[0].first), searches[1].second,
                                          sinkFor(searches[1].first));
        }
        for (const auto& [kind, search] : searches) {
            if (isFull()) {
                break;
            }
            if (auto searched = _connection.search(search, sinkFor(kind)); !searched) {
                return searched;
            }
        }
        return {};
    }

    /// Finds users and groups with one search. Returns false if an entry came that may be either: nothing is added
    /// then.
    [[nodiscard]] Result<bool> lookUpInOne(std::span<const std::string> values) {
        const auto users = _mapping.matching(AccountKind::user, _query.attribute, _query.match, values);
        const auto groups = _mapping.matching(AccountKind::group, _query.attribute, _query.match, values);
        if (!users || !groups) {
            return false;
        }
        const std::string& userFilter = _mapping.filter(AccountKind::user);
        const std::string& groupFilter = _mapping.filter(AccountKind::group);
        LdapSearch search;
        search.base = _mapping.base(AccountKind::user);
        search.filter = *users == *groups
                            ? filterAll(std::array{*users, filterAny(std::array{userFilter, groupFilter})})
                            : filterAny(std::array{filterAll(std::array{*users, userFilter}),
                                                   filterAll(std::array{*groups, groupFilter})});
        search.attributes = _mapping.needed(AccountKind::user, _query.attributes);
        for (std::string& attribute : _mapping.needed(AccountKind::group, _query.attributes)) {
            if (std::find(search.attributes.begin(), search.attributes.end(), attribute) == search.attributes.end()) {
                search.attributes.push_back(std::move(attribute));
            }
        }
        search.attributes.emplace_back("objectClass");
        std::vector<std::pair<AccountKind, LdapEntry>> entries;
        bool isTold = true;
        const auto searched = _connection.search(search, [&](LdapEntry entry) {
            const auto kind = _mapping.kindOf(entry);
            isTold = kind.has_value();
            if (kind) {
                entries.emplace_back(*kind, std::move(entry));
            }
            return isTold;
        });
        if (!searched) {
            return failure(searched.error());
        }
        if (isTold) {
            for (const auto& [kind, entry] : entries) {
                add(kind, entry);
            }
        }
        return isTold;
    }

    LdapConnection& _connection;
    const LdapMapping& _mapping;
    const std::string& _node;
    const DirectoryQuery& _query;
    std::vector<AccountKind> _kinds;
    bool _paged = false;
    bool _wantsMembers = false;
    std::array<Found, 2> _found;
    std::vector<LdapEntry> _groups;  ///< if their members are asked for
};

}  // namespace

Result<std::vector<DirectoryRecord>> ldapRecords(LdapConnection& connection, const LdapMapping& mapping,
                                                 const std::string& node, const DirectoryQuery& query) {
    return Query(connection, mapping, node, query).run();
}

}  // namespace adminhost
