#include "platform/directory/LdapMembers.h"

#include "platform/directory/LdapFilter.h"
#include "platform/directory/LdapQuery.h"
#include "platform/directory/LdapRecord.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <map>
#include <optional>
#include <span>

namespace adminhost {
namespace {

constexpr int deepest = 8;
constexpr std::string_view rangeOption = ";range=";

/// A part of the values of an attribute: "member;range=0-1499", or "member;range=1500-*" for the last part.
struct Range {
    const std::vector<std::string>* values = nullptr;
    std::optional<std::size_t> next;  ///< where the rest begins
};

std::optional<Range> rangeOf(const LdapEntry& entry, std::string_view attribute) {
    for (const auto& [name, values] : entry.attributes) {
        const std::size_t option = name.find(rangeOption);
        const std::size_t dash = name.find('-', option == std::string::npos ? 0 : option);
        if (option == std::string::npos || dash == std::string::npos ||
            !equalLdapNames(std::string_view(name).substr(0, option), attribute)) {
            continue;
        }
        Range range{&values, std::nullopt};
        std::size_t last = 0;
        const char* const end = name.data() + name.size();
        if (std::from_chars(name.data() + dash + 1, end, last).ec == std::errc()) {
            range.next = last + 1;
        }
        return range;
    }
    return std::nullopt;
}

void append(std::vector<std::string>& all, const std::vector<std::string>& more) {
    all.insert(all.end(), more.begin(), more.end());
}

Result<std::vector<std::string>> allValues(LdapConnection& connection, const LdapEntry& entry,
                                           const std::string& attribute) {
    std::vector<std::string> all;
    if (const std::vector<std::string>* whole = entry.values(attribute)) {
        append(all, *whole);
    }
    LdapEntry part = entry;
    std::size_t before = 0;
    while (const auto range = rangeOf(part, attribute)) {
        append(all, *range->values);
        if (!range->next || *range->next <= before) {
            break;  // the last part, or a server that does not advance
        }
        before = *range->next;
        LdapSearch search;
        search.base = entry.dn;
        search.scope = LDAP_SCOPE_BASE;
        search.filter = "(objectClass=*)";
        search.attributes = {attribute + std::string(rangeOption) + std::to_string(before) + "-*"};
        LdapEntry next;
        const auto searched = connection.search(search, [&](LdapEntry received) {
            next = std::move(received);
            return true;
        });
        if (!searched) {
            return failure(searched.error());
        }
        part = std::move(next);
    }
    return all;
}

/// Calls the function with at most as many of the values as one search looks up, until all were given or it fails.
template <class Function>
Result<void> inParts(std::span<const std::string> values, Function function) {
    for (std::size_t begin = 0; begin < values.size(); begin += ldapValuesInOneSearch) {
        const std::size_t count = std::min(ldapValuesInOneSearch, values.size() - begin);
        if (Result<void> done = function(values.subspan(begin, count)); !done) {
            return done;
        }
    }
    return {};
}

/// The logins of the users with these DNs, in the order of the server.
Result<std::vector<std::string>> loginsOf(LdapConnection& connection, const LdapMapping& mapping,
                                          const std::vector<std::string>& dns) {
    std::vector<std::string> logins;
    const auto done = inParts(dns, [&](std::span<const std::string> part) -> Result<void> {
        std::vector<std::string> filters;
        for (const std::string& dn : part) {
            filters.push_back(filterEqual(mapping.dnAttribute(), dn));
        }
        LdapSearch search;
        search.base = mapping.base(AccountKind::user);
        search.filter = filterAll(std::array{filterAny(filters), mapping.filter(AccountKind::user)});
        search.attributes = mapping.needed(AccountKind::user, {});
        return connection.search(search, [&](const LdapEntry& entry) {
            if (auto names = ldapNamesOf(mapping, AccountKind::user, entry); !names.empty()) {
                logins.push_back(std::move(names.front()));
            }
            return true;
        });
    });
    return done ? Result<std::vector<std::string>>(std::move(logins)) : failure(done.error());
}

class Groups {
  public:
    Groups(LdapConnection& connection, const LdapMapping& mapping, const DirectoryRecord& person,
           const std::vector<std::string>& attributes)
        : _connection(connection), _mapping(mapping), _person(person), _attributes(attributes) {}

    [[nodiscard]] Result<std::vector<DirectoryRecord>> run() {
        std::vector<std::string> filters;
        for (const std::string& login : _person.values(directory::recordName)) {
            for (const std::string& attribute : _mapping.memberLogins()) {
                filters.push_back(filterEqual(attribute, login));
            }
        }
        appendFilters(_person.place, filters);
        const std::string_view id = _mapping.attribute(AccountKind::group, directory::primaryGroupID);
        if (const std::string* primary = _person.first(directory::primaryGroupID); primary != nullptr && !id.empty()) {
            filters.push_back(filterEqual(id, *primary));
        }
        if (auto searched = search(filters); !searched) {
            return failure(searched.error());
        }
        for (int depth = 1; depth < deepest && !_newest.empty(); ++depth) {
            const std::vector<std::string> members = std::move(_newest);
            _newest.clear();
            const auto searched = inParts(members, [&](std::span<const std::string> part) {
                std::vector<std::string> containing;
                for (const std::string& dn : part) {
                    appendFilters(dn, containing);
                }
                return search(containing);
            });
            if (!searched) {
                return failure(searched.error());
            }
        }
        std::vector<DirectoryRecord> groups;
        for (auto& [dn, record] : _found) {
            if (record) {
                groups.push_back(*std::move(record));
            }
        }
        return groups;
    }

  private:
    void appendFilters(const std::string& dn, std::vector<std::string>& filters) const {
        if (dn.empty()) {
            return;
        }
        for (const std::string& attribute : _mapping.memberDns()) {
            filters.push_back(filterEqual(attribute, dn));
        }
    }

    [[nodiscard]] Result<void> search(const std::vector<std::string>& filters) {
        if (filters.empty()) {
            return {};
        }
        LdapSearch search;
        search.base = _mapping.base(AccountKind::group);
        search.filter = filterAll(std::array{filterAny(filters), _mapping.filter(AccountKind::group)});
        search.attributes = _mapping.needed(AccountKind::group, _attributes);
        search.pageSize = ldapValuesInOneSearch;
        return _connection.search(search, [&](const LdapEntry& entry) {
            // A group that was found before is not searched for again, so cycles end.
            if (_found
                    .try_emplace(entry.dn, ldapRecordOf(_mapping, AccountKind::group, _person.node, entry, _attributes))
                    .second) {
                _newest.push_back(entry.dn);
            }
            return true;
        });
    }

    LdapConnection& _connection;
    const LdapMapping& _mapping;
    const DirectoryRecord& _person;
    const std::vector<std::string>& _attributes;
    std::map<std::string, std::optional<DirectoryRecord>> _found;  ///< nullopt: its name cannot be carried
    std::vector<std::string> _newest;                              ///< whose containing groups are not known yet
};

}  // namespace

Result<std::vector<std::string>> ldapMembersByDn(LdapConnection& connection, const LdapMapping& mapping,
                                                 const LdapEntry& group) {
    std::vector<std::string> logins;
    std::vector<std::string> others;
    const std::string_view nameAttribute = mapping.attributeOfKey(AccountKind::user, "RecordName");
    for (const std::string& attribute : mapping.memberDns()) {
        auto dns = allValues(connection, group, attribute);
        if (!dns) {
            return dns;
        }
        for (std::string& dn : *dns) {
            std::string login = ldapRdnValue(dn, nameAttribute);
            (login.empty() ? others : logins).push_back(login.empty() ? std::move(dn) : std::move(login));
        }
    }
    auto found = loginsOf(connection, mapping, others);
    if (!found) {
        return found;
    }
    append(logins, *found);
    return logins;
}

Result<std::vector<DirectoryRecord>> ldapGroupsOf(LdapConnection& connection, const LdapMapping& mapping,
                                                  const DirectoryRecord& person,
                                                  const std::vector<std::string>& attributes) {
    return Groups(connection, mapping, person, attributes).run();
}

}  // namespace adminhost
