#include "platform/directory/LdapAccounts.h"

#include "platform/crypto/Crypt.h"
#include "platform/directory/DirectoryRequest.h"
#include "platform/directory/LdapFilter.h"
#include "platform/directory/LdapQuery.h"
#include "platform/directory/LdapRecord.h"

#include <array>
#include <map>

#include <fmt/format.h>

namespace adminhost {
namespace {

bool isDn(const std::string& text) {
    LDAPDN parsed = nullptr;
    const bool valid = ::ldap_str2dn(text.c_str(), &parsed, LDAP_DN_FORMAT_LDAPV3) == LDAP_SUCCESS;
    const LdapDn owned(parsed);
    return valid && parsed != nullptr;
}

/// "ATTRIBUTE=VALUE,BASE" with the value escaped.
std::string dnBelow(const std::string& base, std::string_view attribute, std::string_view value) {
    LDAPAVA part{};
    part.la_attr = bervalOf(attribute);
    part.la_value = bervalOf(value);
    part.la_flags = LDAP_AVA_STRING;
    std::array<LDAPAVA*, 2> parts{&part, nullptr};
    char* text = nullptr;
    if (::ldap_rdn2str(parts.data(), &text, LDAP_DN_FORMAT_LDAPV3) != LDAP_SUCCESS) {
        return {};
    }
    const LdapText owned(text);
    return base.empty() ? std::string(text) : std::string(text).append(",").append(base);
}

std::string withName(std::string text, std::string_view name) {
    for (std::size_t at = text.find("%u"); at != std::string::npos; at = text.find("%u", at + name.size())) {
        text.replace(at, 2, name);
    }
    return text;
}

}  // namespace

LdapAccounts::~LdapAccounts() {
    end();
}

void LdapAccounts::end() noexcept {
    _outsideRequest.reset();
    if (const auto connection = _signedIn.lock()) {
        dropFromRequest(connection.get());
    }
}

Result<bool> LdapAccounts::signIn(std::string_view name, std::string_view password) {
    end();
    if (password.empty()) {
        return failure(ldapError(LDAP_UNWILLING_TO_PERFORM, _lookUps->settings().name, "the password is empty"));
    }
    auto dn = dnOfAdministrator(name);
    if (!dn) {
        return failure(dn.error());
    }
    LdapSignIn signIn{*std::move(dn), std::string(password)};
    const ScopedCleanse wipePassword(signIn.password);
    auto opened = _lookUps->signIn(signIn);
    if (!opened) {
        return failure(opened.error());
    }
    std::shared_ptr<LdapConnection> connection = *std::move(opened);
    _signedIn = connection;
    if (inDirectoryRequest()) {
        keepForRequest(std::move(connection));
    } else {
        _outsideRequest = std::move(connection);
    }
    return true;
}

Result<std::string> LdapAccounts::dnOfAdministrator(std::string_view name) {
    if (isDn(std::string(name))) {
        return std::string(name);
    }
    const LdapMapping& mapping = _lookUps->mapping();
    LdapSearch search;
    search.base = mapping.base(AccountKind::user);
    search.filter = filterEqual(mapping.attributeOfKey(AccountKind::user, "RecordName"), name);
    search.attributes = {LDAP_NO_ATTRS};
    return _lookUps->run<std::string>([&](LdapConnection& connection) -> Result<std::string> {
        std::vector<std::string> dns;
        const auto searched = connection.search(search, [&](LdapEntry entry) {
            dns.push_back(std::move(entry.dn));
            return dns.size() < 2;
        });
        if (!searched) {
            return failure(searched.error());
        }
        if (dns.size() != 1) {
            return failure(ldapError(LDAP_INVALID_CREDENTIALS, fmt::format("bind as {}", name),
                                     dns.empty() ? "no entry has this name" : "several entries have this name"));
        }
        return std::move(dns.front());
    });
}

Result<std::shared_ptr<LdapConnection>> LdapAccounts::needed() const {
    auto connection = _signedIn.lock();
    if (!connection) {
        return failure(
            ldapError(LDAP_INSUFFICIENT_ACCESS, _lookUps->settings().name, "no administrator has signed in"));
    }
    return connection;
}

Result<std::string> LdapAccounts::dnOf(LdapConnection& connection, std::string_view type, std::string_view name) {
    DirectoryQuery query;
    query.recordTypes = {std::string(type)};
    query.attribute = directory::recordName;
    query.values = {std::string(name)};
    const auto records = ldapRecords(connection, _lookUps->mapping(), _lookUps->settings().name, query);
    if (!records) {
        return failure(records.error());
    }
    if (records->empty()) {
        return failure(ldapError(LDAP_NO_SUCH_OBJECT, _lookUps->settings().name, fmt::format("no record {}", name)));
    }
    if (records->size() > 1) {
        return failure(ldapError(LDAP_UNWILLING_TO_PERFORM, _lookUps->settings().name,
                                 fmt::format("several records have the name {}", name)));
    }
    return records->front().place;
}

Result<std::optional<DirectoryRecord>> LdapAccounts::create(std::string_view name,
                                                            const DirectoryAttributes& attributes) {
    const auto connection = needed();
    if (!connection) {
        return failure(connection.error());
    }
    const LdapNodeSettings& settings = _lookUps->settings();
    const LdapMapping& mapping = _lookUps->mapping();
    const std::string nameAttribute(mapping.attributeOfKey(AccountKind::user, "RecordName"));
    const std::string& base = settings.createBase.empty() ? mapping.base(AccountKind::user) : settings.createBase;
    const std::string dn = dnBelow(base, nameAttribute, name);
    std::map<std::string, std::vector<std::string>> values{{"objectClass", settings.objectClasses},
                                                           {nameAttribute, {std::string(name)}}};
    for (const auto& [attribute, texts] : attributes) {
        const std::string_view mapped = mapping.attribute(AccountKind::user, attribute);
        if (mapped.empty()) {
            return failure(ldapError(LDAP_NO_SUCH_ATTRIBUTE, settings.name, attribute + " is not mapped"));
        }
        values.insert_or_assign(std::string(mapped), texts);
    }
    for (const auto& [attribute, texts] : settings.createAttributes) {
        std::vector<std::string>& named = values[attribute];
        named.clear();
        for (const std::string& text : texts) {
            named.push_back(withName(text, name));
        }
    }
    if (const auto added = (*connection)->add(dn, values); !added) {
        return failure(added.error());
    }
    std::vector<std::string> names{std::string(directory::recordName)};
    for (const auto& [attribute, texts] : attributes) {
        names.push_back(attribute);
    }
    LdapSearch search;
    search.base = dn;
    search.scope = LDAP_SCOPE_BASE;
    search.filter = mapping.filter(AccountKind::user);
    search.attributes = mapping.needed(AccountKind::user, names);
    std::optional<DirectoryRecord> created;
    const auto searched = (*connection)->search(search, [&](const LdapEntry& entry) {
        created = ldapRecordOf(mapping, AccountKind::user, settings.name, entry, names);
        return true;
    });
    // An entry that the server has added but does not show is one that did not come back.
    if (!searched && searched.error().code != LDAP_NO_SUCH_OBJECT) {
        return failure(searched.error());
    }
    return created;
}

Result<void> LdapAccounts::remove(std::string_view type, std::string_view name) {
    const auto connection = needed();
    if (!connection) {
        return failure(connection.error());
    }
    const auto dn = dnOf(**connection, type, name);
    return dn ? (*connection)->remove(*dn) : failure(dn.error());
}

Result<void> LdapAccounts::setPassword(std::string_view type, std::string_view name, std::string_view password) {
    const auto connection = needed();
    if (!connection) {
        return failure(connection.error());
    }
    const auto dn = dnOf(**connection, type, name);
    return dn ? (*connection)->setPassword(*dn, password) : failure(dn.error());
}

}  // namespace adminhost
