#include "platform/directory/LdapRecord.h"

#include "platform/directory/CarriedText.h"
#include "platform/directory/KerberosAuthority.h"
#include "platform/directory/LdapUuid.h"

#include <algorithm>
#include <charconv>
#include <cstdint>

namespace adminhost {
namespace {

using Values = std::vector<std::string>;

const Values& valuesOf(const LdapEntry& entry, std::string_view attribute) {
    static const Values none;
    const Values* values = attribute.empty() ? nullptr : entry.values(attribute);
    return values == nullptr ? none : *values;
}

/// Calls the function with attribute and value of each part of a DN's first component.
template <class Function>
void forEachOfRdn(const std::string& dn, Function function) {
    LDAPDN parsed = nullptr;
    if (::ldap_str2dn(dn.c_str(), &parsed, LDAP_DN_FORMAT_LDAPV3) != LDAP_SUCCESS) {
        return;
    }
    const LdapDn owned(parsed);
    if (parsed == nullptr || parsed[0] == nullptr) {
        return;
    }
    for (LDAPAVA** part = parsed[0]; *part != nullptr; ++part) {
        function(textOf((*part)->la_attr), textOf((*part)->la_value));
    }
}

Values idsIn(const Values& values) {
    Values ids;
    for (const std::string& value : values) {
        std::uint32_t id = 0;
        const char* end = value.data() + value.size();
        const auto result = std::from_chars(value.data(), end, id);
        if (result.ec == std::errc() && result.ptr == end) {
            ids.push_back(std::to_string(id));
        }
    }
    return ids;
}

Values uuidsIn(const Values& values, LdapNodeSettings::UuidForm form) {
    Values uuids;
    for (const std::string& value : values) {
        if (const auto uuid = uuidOfLdapValue(value, form)) {
            uuids.push_back(textOf(*uuid));
        }
    }
    return uuids;
}

/// The mapped attribute, or what is built from the principals, or from the name.
Values authoritiesOf(const LdapMapping& mapping, AccountKind kind, const LdapEntry& entry) {
    Values authorities;
    for (const std::string& value : valuesOf(entry, mapping.attributeOfKey(kind, "AuthenticationAuthority"))) {
        authorities.push_back(carriedTextOf(value));
    }
    if (!authorities.empty() || kind != AccountKind::user) {
        return authorities;
    }
    Values principals;
    for (const std::string& value : valuesOf(entry, mapping.attributeOfKey(kind, "KerberosPrincipal"))) {
        if (isCarriedText(value)) {
            principals.push_back(value);
        }
    }
    if (principals.empty() && !mapping.realm().empty()) {
        if (const Values names = ldapNamesOf(mapping, kind, entry); !names.empty()) {
            principals.push_back(kerberosPrincipalOf(names.front(), mapping.realm()));
        }
    }
    for (const std::string& principal : principals) {
        const std::string realm = mapping.realm().empty() ? defaultKerberosRealm() : mapping.realm();
        if (auto authority = kerberosAuthority(principal, realm)) {
            authorities.push_back(*std::move(authority));
        }
    }
    return authorities;
}

Values loginsIn(const LdapMapping& mapping, const LdapEntry& entry) {
    Values logins;
    for (const std::string& attribute : mapping.memberLogins()) {
        for (const std::string& value : valuesOf(entry, attribute)) {
            if (isCarriedText(value)) {
                logins.push_back(value);
            }
        }
    }
    return logins;
}

Values textsOf(const LdapMapping& mapping, AccountKind kind, const LdapEntry& entry, const std::string& name) {
    if (name == directory::recordName) {
        return ldapNamesOf(mapping, kind, entry);
    }
    if (name == directory::authenticationAuthority) {
        return authoritiesOf(mapping, kind, entry);
    }
    if (name == directory::groupMembership && kind == AccountKind::group) {
        return loginsIn(mapping, entry);
    }
    const Values& values = valuesOf(entry, mapping.attribute(kind, name));
    if (name == directory::generatedUID) {
        return uuidsIn(values, mapping.uuidForm());
    }
    if (name == directory::uniqueID || name == directory::primaryGroupID) {
        return idsIn(values);
    }
    Values texts(values.size());
    std::transform(values.begin(), values.end(), texts.begin(), [](const std::string& v) { return carriedTextOf(v); });
    return texts;
}

}  // namespace

std::string ldapRdnValue(const std::string& dn, std::string_view attribute) {
    std::string found;
    forEachOfRdn(dn, [&](const std::string& name, const std::string& value) {
        if (equalLdapNames(name, attribute)) {
            found = value;
        }
    });
    return found;
}

std::vector<std::string> ldapNamesOf(const LdapMapping& mapping, AccountKind kind, const LdapEntry& entry) {
    Values names;
    for (const std::string& value : valuesOf(entry, mapping.attributeOfKey(kind, "RecordName"))) {
        if (!value.empty() && isCarriedText(value)) {
            names.push_back(value);
        }
    }
    if (names.size() > 1) {
        forEachOfRdn(entry.dn, [&](const std::string& /*attribute*/, const std::string& value) {
            std::stable_partition(names.begin(), names.end(),
                                  [&](const std::string& name) { return equalLdapNames(name, value); });
        });
    }
    return names;
}

std::optional<DirectoryRecord> ldapRecordOf(const LdapMapping& mapping, AccountKind kind, const std::string& node,
                                            const LdapEntry& entry, std::span<const std::string> attributes) {
    if (!valuesOf(entry, mapping.attributeOfKey(kind, "RecordName")).empty() &&
        ldapNamesOf(mapping, kind, entry).empty()) {
        return std::nullopt;
    }
    DirectoryRecord record;
    record.type = kind == AccountKind::user ? directory::users : directory::groups;
    record.node = node;
    record.place = entry.dn;
    for (const std::string& name : attributes) {
        if (auto texts = textsOf(mapping, kind, entry, name); !texts.empty()) {
            record.attributes.emplace(name, std::move(texts));
        }
    }
    return record;
}

}  // namespace adminhost
