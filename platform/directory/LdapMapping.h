#pragma once

// How the records of an LDAP node are stored in its server: bases, filters and attributes of users and groups.

#include "platform/directory/AccountFiles.h"
#include "platform/directory/Directory.h"
#include "platform/directory/LdapConnection.h"
#include "platform/directory/LdapNode.h"

#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

class LdapMapping {
  public:
    explicit LdapMapping(const LdapNodeSettings& settings);

    [[nodiscard]] const std::string& base(AccountKind kind) const noexcept { return of(kind).base; }
    /// The filter of all entries of the kind.
    [[nodiscard]] const std::string& filter(AccountKind kind) const noexcept { return of(kind).filter; }
    [[nodiscard]] LdapNodeSettings::UuidForm uuidForm() const noexcept { return _uuidForm; }
    /// The realm of principals that do not name one; empty for the default of Kerberos' own configuration.
    [[nodiscard]] const std::string& realm() const noexcept { return _realm; }

    /// The LDAP attribute of a configuration key ("RecordName", "KerberosPrincipal"); empty if there is none.
    [[nodiscard]] std::string_view attributeOfKey(AccountKind kind, std::string_view key) const noexcept;
    /// The same of "dsAttrTypeStandard:" and the key.
    [[nodiscard]] std::string_view attribute(AccountKind kind, std::string_view name) const noexcept;
    /// The attributes that an entry is needed with to have these record attributes, always with its names.
    [[nodiscard]] std::vector<std::string> needed(AccountKind kind, std::span<const std::string> names) const;

    /// True if one search can find both kinds, because kindOf() can tell them apart.
    [[nodiscard]] bool isOneSearch() const noexcept { return _oneSearch; }
    /// The kind of an entry that has its object classes. Returns nullopt if only the server knows.
    [[nodiscard]] std::optional<AccountKind> kindOf(const LdapEntry& entry) const noexcept;

    /// The entries of the kind whose attribute has one of the values. Returns nullopt if there cannot be any.
    [[nodiscard]] std::optional<std::string> matching(AccountKind kind, std::string_view name,
                                                      DirectoryQuery::Match match,
                                                      std::span<const std::string> values) const;

    /// The attributes of groups that list members: by login, and by DN.
    [[nodiscard]] const std::vector<std::string>& memberLogins() const noexcept { return _memberLogins; }
    [[nodiscard]] const std::vector<std::string>& memberDns() const noexcept { return _memberDns; }
    /// The attribute that holds an entry's own DN.
    [[nodiscard]] std::string_view dnAttribute() const noexcept { return _dnAttribute; }

  private:
    struct Kind {
        std::string base;
        std::string filter;
        std::map<std::string, std::string, std::less<>> attributes;
    };
    [[nodiscard]] const Kind& of(AccountKind kind) const noexcept { return kind == AccountKind::user ? _user : _group; }

    Kind _user;
    Kind _group;
    LdapNodeSettings::UuidForm _uuidForm = LdapNodeSettings::UuidForm::text;
    std::string _realm;
    bool _oneSearch = false;
    std::vector<std::string> _memberLogins;
    std::vector<std::string> _memberDns;
    std::string_view _dnAttribute;
};

/// The keys that a mapping of users or groups may have.
[[nodiscard]] std::span<const std::string_view> ldapMappingKeys() noexcept;

/// Returns true if the names are equal without regard to the case of ASCII letters.
[[nodiscard]] bool equalLdapNames(std::string_view a, std::string_view b) noexcept;

}  // namespace adminhost
