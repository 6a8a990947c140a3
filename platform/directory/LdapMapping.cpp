#include "platform/directory/LdapMapping.h"

#include "platform/directory/LdapFilter.h"
#include "platform/directory/LdapUuid.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <cstdint>

namespace adminhost {
namespace {

using Schema = LdapNodeSettings::Schema;
using UuidForm = LdapNodeSettings::UuidForm;

constexpr std::string_view standardPrefix = "dsAttrTypeStandard:";
constexpr std::array<std::string_view, 10> keys = {"RecordName",       "RealName",        "GeneratedUID",
                                                   "UniqueID",         "PrimaryGroupID",  "NFSHomeDirectory",
                                                   "UserShell",        "GroupMembership", "AuthenticationAuthority",
                                                   "KerberosPrincipal"};

using Attributes = std::map<std::string, std::string, std::less<>>;

Attributes usersOf(Schema schema) {
    Attributes attributes{{"RecordName", "uid"},           {"RealName", "cn"},
                          {"GeneratedUID", "entryUUID"},   {"UniqueID", "uidNumber"},
                          {"PrimaryGroupID", "gidNumber"}, {"NFSHomeDirectory", "homeDirectory"},
                          {"UserShell", "loginShell"},     {"KerberosPrincipal", "krbPrincipalName"}};
    if (schema == Schema::ad) {
        attributes["RecordName"] = "sAMAccountName";
        attributes["RealName"] = "displayName";
        attributes["GeneratedUID"] = "objectGUID";
        attributes["NFSHomeDirectory"] = "unixHomeDirectory";
        attributes["KerberosPrincipal"] = "userPrincipalName";
    }
    return attributes;
}

Attributes groupsOf(Schema schema) {
    Attributes attributes{{"RecordName", "cn"}, {"GeneratedUID", "entryUUID"}, {"PrimaryGroupID", "gidNumber"}};
    if (schema == Schema::ad) {
        attributes["RecordName"] = "sAMAccountName";
        attributes["GeneratedUID"] = "objectGUID";
    }
    return attributes;
}

std::string userFilterOf(Schema schema) {
    return schema == Schema::ad ? "(&(objectCategory=person)(objectClass=user))" : "(objectClass=posixAccount)";
}

std::string groupFilterOf(Schema schema) {
    switch (schema) {
        case Schema::rfc2307:
            return "(objectClass=posixGroup)";
        case Schema::rfc2307bis:
            return "(|(objectClass=posixGroup)(objectClass=groupOfNames)(objectClass=groupOfUniqueNames))";
        case Schema::ad:
            break;
    }
    return "(objectClass=group)";
}

const std::string& firstOf(const std::string& a, const std::string& b) {
    return a.empty() ? b : a;
}

/// In a configuration the outer parentheses may be left out.
std::string enclosed(std::string filter) {
    return filter.empty() || filter.front() == '(' ? filter : "(" + filter + ")";
}

char lower(char c) noexcept {
    return c >= 'A' && c <= 'Z' ? static_cast<char>(c - 'A' + 'a') : c;
}

bool isId(const std::string& text) {
    std::uint32_t id = 0;
    const char* end = text.data() + text.size();
    const auto result = std::from_chars(text.data(), end, id);
    return result.ec == std::errc() && result.ptr == end && std::to_string(id) == text;
}

void appendUuidFilters(std::string_view attribute, UuidForm form, const Uuid& uuid, std::vector<std::string>& filters) {
    const std::string value = ldapValueOf(uuid, form);
    filters.push_back(filterEqual(attribute, value));
    // The server compares entryUUID without regard to case. Another attribute may be a text of any kind.
    if (form == UuidForm::text && !equalLdapNames(attribute, "entryUUID")) {
        filters.push_back(filterEqual(attribute, textOf(uuid)));
    }
}

}  // namespace

bool equalLdapNames(std::string_view a, std::string_view b) noexcept {
    return std::equal(a.begin(), a.end(), b.begin(), b.end(), [](char x, char y) { return lower(x) == lower(y); });
}

std::span<const std::string_view> ldapMappingKeys() noexcept {
    return keys;
}

LdapMapping::LdapMapping(const LdapNodeSettings& settings)
    : _user{firstOf(settings.userBase, settings.base),
            enclosed(firstOf(settings.userFilter, userFilterOf(settings.schema))), usersOf(settings.schema)},
      _group{firstOf(settings.groupBase, settings.base),
             enclosed(firstOf(settings.groupFilter, groupFilterOf(settings.schema))), groupsOf(settings.schema)},
      _uuidForm(settings.uuidForm.value_or(settings.schema == Schema::ad ? UuidForm::guid : UuidForm::text)),
      _realm(settings.kerberosRealm),
      _dnAttribute(settings.schema == Schema::ad ? "distinguishedName" : "entryDN") {
    for (const auto& [key, attribute] : settings.userMap) {
        _user.attributes.insert_or_assign(key, attribute);
    }
    for (const auto& [key, attribute] : settings.groupMap) {
        _group.attributes.insert_or_assign(key, attribute);
    }
    _oneSearch = settings.schema != Schema::ad && settings.userFilter.empty() && settings.groupFilter.empty() &&
                 _user.base == _group.base;
    _memberDns = settings.schema == Schema::ad ? std::vector<std::string>{"member"}
                                               : std::vector<std::string>{"member", "uniqueMember"};
    if (settings.schema != Schema::ad) {
        _memberLogins = {"memberUid"};
    }
    // A configured attribute can hold either form.
    if (const auto configured = settings.groupMap.find("GroupMembership"); configured != settings.groupMap.end()) {
        _memberLogins = {configured->second};
        _memberDns = {configured->second};
    }
}

std::string_view LdapMapping::attributeOfKey(AccountKind kind, std::string_view key) const noexcept {
    const auto found = of(kind).attributes.find(key);
    return found == of(kind).attributes.end() ? std::string_view() : found->second;
}

std::string_view LdapMapping::attribute(AccountKind kind, std::string_view name) const noexcept {
    return name.starts_with(standardPrefix) ? attributeOfKey(kind, name.substr(standardPrefix.size()))
                                            : std::string_view();
}

std::vector<std::string> LdapMapping::needed(AccountKind kind, std::span<const std::string> names) const {
    std::vector<std::string> needed;
    const auto need = [&](std::string_view attribute) {
        if (!attribute.empty() && std::find(needed.begin(), needed.end(), attribute) == needed.end()) {
            needed.emplace_back(attribute);
        }
    };
    need(attributeOfKey(kind, "RecordName"));
    for (const std::string& name : names) {
        if (kind == AccountKind::group && name == directory::groupMembership) {
            std::for_each(_memberLogins.begin(), _memberLogins.end(), need);
            std::for_each(_memberDns.begin(), _memberDns.end(), need);
            continue;
        }
        need(attribute(kind, name));
        if (kind == AccountKind::user && name == directory::authenticationAuthority) {
            need(attributeOfKey(kind, "KerberosPrincipal"));
        }
    }
    return needed;
}

std::optional<AccountKind> LdapMapping::kindOf(const LdapEntry& entry) const noexcept {
    const std::vector<std::string>* classes = entry.values("objectClass");
    const auto has = [&](std::string_view name) {
        return classes != nullptr && std::any_of(classes->begin(), classes->end(),
                                                 [&](const std::string& value) { return equalLdapNames(value, name); });
    };
    if (has("posixAccount")) {
        return AccountKind::user;
    }
    if (has("posixGroup") || has("groupOfNames") || has("groupOfUniqueNames")) {
        return AccountKind::group;
    }
    return std::nullopt;  // of a class that is derived from one of these
}

std::optional<std::string> LdapMapping::matching(AccountKind kind, std::string_view name, DirectoryQuery::Match match,
                                                 std::span<const std::string> values) const {
    const std::string_view attribute = this->attribute(kind, name);
    if (attribute.empty()) {
        return std::nullopt;
    }
    std::vector<std::string> filters;
    for (const std::string& value : values) {
        if (match == DirectoryQuery::Match::beginsWith) {
            filters.push_back(filterBeginning(attribute, value));
        } else if (name == directory::generatedUID) {
            if (const auto uuid = uuidOf(value)) {
                appendUuidFilters(attribute, _uuidForm, *uuid, filters);
            }
        } else if (!value.empty() &&
                   ((name != directory::uniqueID && name != directory::primaryGroupID) || isId(value))) {
            filters.push_back(filterEqual(attribute, value));
        }
    }
    return filters.empty() ? std::nullopt : std::optional(filterAny(filters));
}

}  // namespace adminhost
