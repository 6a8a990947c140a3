#pragma once

// OpenLDAP's library: its start in this process, owners of its objects, and its errors.

#include "platform/value/Error.h"

#include <memory>
#include <string>
#include <string_view>

#include <ldap.h>

namespace adminhost {

/// Starts the library without its own files and environment variables (ldap.conf, .ldaprc, LDAPBASE and so on), which
/// would silently change what a node connects to and whether certificates are checked. Called before anything else of
/// the library; does nothing from the second call on.
void startLdapLibrary();

struct FreeLdapMemory {
    void operator()(char* memory) const noexcept { ::ldap_memfree(memory); }
};
using LdapText = std::unique_ptr<char, FreeLdapMemory>;

struct FreeLdapMessage {
    void operator()(LDAPMessage* message) const noexcept { ::ldap_msgfree(message); }
};
using LdapMessage = std::unique_ptr<LDAPMessage, FreeLdapMessage>;

struct CloseLdap {
    // Also sends the server an unbind request, without waiting.
    void operator()(LDAP* ldap) const noexcept { ::ldap_unbind_ext(ldap, nullptr, nullptr); }
};
using LdapHandle = std::unique_ptr<LDAP, CloseLdap>;

struct FreeLdapUrl {
    void operator()(LDAPURLDesc* url) const noexcept { ::ldap_free_urldesc(url); }
};
using LdapUrl = std::unique_ptr<LDAPURLDesc, FreeLdapUrl>;

struct FreeLdapDn {
    void operator()(LDAPDN dn) const noexcept { ::ldap_dnfree(dn); }
};
/// Null for an empty DN too.
using LdapDn = std::unique_ptr<LDAPRDN, FreeLdapDn>;

/// A text as the library's pointer and length. It points into the text.
[[nodiscard]] inline berval bervalOf(std::string_view text) noexcept {
    // The library does not change what it is given.
    return {text.size(), const_cast<char*>(text.data())};
}
[[nodiscard]] inline std::string textOf(const berval& value) {
    return value.bv_len == 0 ? std::string() : std::string(value.bv_val, value.bv_len);
}

/// The error of a result code: "WHAT: the library's words: the server's words". The words of the handle are those of
/// its last operation; without a handle there are none.
[[nodiscard]] Error ldapError(int code, std::string_view what, LDAP* ldap = nullptr);
[[nodiscard]] Error ldapError(int code, std::string_view what, std::string_view words);

/// Returns true if the code means that no answer of the server arrived, or an answer that it cannot serve anybody.
[[nodiscard]] bool isUnreachable(std::int64_t code) noexcept;

}  // namespace adminhost
