#include "platform/directory/LdapFilter.h"
#include "platform/directory/LdapLibrary.h"
#include "platform/directory/LdapMapping.h"
#include "platform/directory/LdapNode.h"

#include <algorithm>

#include <fmt/format.h>

namespace adminhost {
namespace {

Result<void> wrong(std::string_view key, std::string_view why) {
    return failure({directory::ldapErrorDomain, LDAP_PARAM_ERROR, fmt::format("{}: {}", key, why)});
}

/// A name as in "uid", "entryUUID" or "1.3.6.1.4": letters, digits, "-", ".", and options after ";".
bool isAttribute(std::string_view name) noexcept {
    return !name.empty() && std::all_of(name.begin(), name.end(), [](char c) {
        return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' || c == '.' ||
               c == ';' || c == '_';
    });
}

bool isDn(const std::string& text) {
    LDAPDN parsed = nullptr;
    const bool valid = ::ldap_str2dn(text.c_str(), &parsed, LDAP_DN_FORMAT_LDAPV3) == LDAP_SUCCESS;
    const LdapDn owned(parsed);
    return valid;
}

Result<void> checkServers(const LdapNodeSettings& settings) {
    if (settings.uris.empty()) {
        return wrong("uri", "name at least one server, for example \"ldaps://ldap.example.com\"");
    }
    for (const std::string& uri : settings.uris) {
        LDAPURLDesc* parsed = nullptr;
        const bool valid = ::ldap_url_parse(uri.c_str(), &parsed) == LDAP_URL_SUCCESS;
        const LdapUrl owned(parsed);
        const bool hasMore = valid && ((parsed->lud_dn != nullptr && *parsed->lud_dn != '\0') ||
                                       parsed->lud_attrs != nullptr || parsed->lud_filter != nullptr);
        const std::string_view scheme = valid ? parsed->lud_scheme : "";
        if (hasMore || (scheme != "ldap" && scheme != "ldaps" && scheme != "ldapi")) {
            return wrong("uri", fmt::format("\"{}\" is not of the form ldap://HOST[:PORT], ldaps://HOST[:PORT] or "
                                            "ldapi://PATH with each \"/\" of the path as \"%2F\"",
                                            uri));
        }
        if (settings.startTls && scheme == "ldaps") {
            return wrong("starttls", fmt::format("\"{}\" uses TLS from the beginning; remove one of the two", uri));
        }
    }
    return {};
}

Result<void> checkPlaces(const LdapNodeSettings& settings) {
    for (const auto& [key, dn] : {std::pair("base", settings.base), std::pair("user_base", settings.userBase),
                                  std::pair("group_base", settings.groupBase), std::pair("bind_dn", settings.bindDn),
                                  std::pair("create_base", settings.createBase)}) {
        if (!isDn(dn)) {
            return wrong(key, fmt::format("\"{}\" is not a distinguished name", dn));
        }
    }
    if (settings.base.empty() && (settings.userBase.empty() || settings.groupBase.empty())) {
        return wrong("base", "set it, for example to \"dc=example,dc=com\"");
    }
    for (const auto& [key, filter] :
         {std::pair("user_filter", settings.userFilter), std::pair("group_filter", settings.groupFilter)}) {
        if (!filter.empty() && !isLdapFilter(filter)) {
            return wrong(key, fmt::format("\"{}\" is not a search filter", filter));
        }
    }
    return {};
}

Result<void> checkSignIn(const LdapNodeSettings& settings) {
    const bool hasFile = settings.bindPasswordFile.has_value();
    const bool hasCredential = !settings.bindPasswordCredential.empty();
    if (hasFile && hasCredential) {
        return wrong("bind_password_file", "remove it or bind_password_credential");
    }
    if (settings.bindPasswordCredential.find('/') != std::string::npos) {
        return wrong("bind_password_credential", "it is the name of a credential, not a path");
    }
    if (settings.bindDn.empty() && (hasFile || hasCredential)) {
        return wrong("bind_dn", "set it, or remove the password");
    }
    if (!settings.bindDn.empty() && !hasFile && !hasCredential) {
        return wrong("bind_dn", "set bind_password_file or bind_password_credential");
    }
    if (settings.sasl != LdapNodeSettings::Sasl::none && !settings.bindDn.empty()) {
        return wrong("sasl", "remove it or bind_dn");
    }
    if (settings.sasl == LdapNodeSettings::Sasl::gssapi && !settings.keytab) {
        return wrong("keytab", "set it: sasl = \"gssapi\" needs a keytab");
    }
    if (settings.certFile.has_value() != settings.keyFile.has_value()) {
        return wrong(settings.certFile ? "key_file" : "cert_file", "set both cert_file and key_file, or neither");
    }
    return {};
}

Result<void> checkMapping(std::string_view table, const std::map<std::string, std::string>& mapping) {
    const auto keys = ldapMappingKeys();
    for (const auto& [key, attribute] : mapping) {
        if (std::find(keys.begin(), keys.end(), key) == keys.end()) {
            return wrong(fmt::format("{}.{}", table, key), "unknown key");
        }
        if (!isAttribute(attribute)) {
            return wrong(fmt::format("{}.{}", table, key), fmt::format("\"{}\" is not an attribute", attribute));
        }
    }
    return {};
}

Result<void> checkCreation(const LdapNodeSettings& settings) {
    if (settings.objectClasses.empty() ||
        !std::all_of(settings.objectClasses.begin(), settings.objectClasses.end(), isAttribute)) {
        return wrong("object_classes", "name the classes of a new account");
    }
    for (const auto& [attribute, values] : settings.createAttributes) {
        if (!isAttribute(attribute)) {
            return wrong(fmt::format("create_attributes.{}", attribute), "this is not an attribute");
        }
        if (values.empty()) {
            return wrong(fmt::format("create_attributes.{}", attribute), "it has no value");
        }
    }
    return {};
}

}  // namespace

Result<void> checkLdapNodeSettings(const LdapNodeSettings& settings) {
    startLdapLibrary();
    if (settings.name.empty() || settings.name == DirectorySession::authenticationSearchNodeName) {
        return wrong("name", settings.name.empty() ? "it is empty" : "\"/Search\" is reserved");
    }
    if (settings.timeout < std::chrono::seconds(1)) {
        return wrong("timeout_seconds", "it must be at least 1");
    }
    return checkServers(settings)
        .and_then([&] { return checkPlaces(settings); })
        .and_then([&] { return checkSignIn(settings); })
        .and_then([&] { return checkMapping("map.users", settings.userMap); })
        .and_then([&] { return checkMapping("map.groups", settings.groupMap); })
        .and_then([&] { return checkCreation(settings); });
}

}  // namespace adminhost
