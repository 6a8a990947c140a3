#include "platform/directory/LdapLibrary.h"

#include "platform/directory/Directory.h"
#include "platform/text/Utf8.h"

#include <cstdlib>
#include <mutex>

#include <fmt/format.h>

namespace adminhost {

void startLdapLibrary() {
    static std::once_flag once;
    std::call_once(once, [] {
        // The library reads the variable when it is first used, and never again. The tools that we run must not inherit
        // it: one of them may rely on its ldap.conf.
        const char* const variable = "LDAPNOINIT";
        const bool isSet = std::getenv(variable) != nullptr;
        ::setenv(variable, "1", 1);
        int version = 0;
        ::ldap_get_option(nullptr, LDAP_OPT_PROTOCOL_VERSION, &version);
        if (!isSet) {
            ::unsetenv(variable);
        }
    });
}

Error ldapError(int code, std::string_view what, std::string_view words) {
    std::string text = fmt::format("{}: {}", what, ::ldap_err2string(code));
    if (!words.empty()) {
        text += ": ";
        text += utf8Of(words);
    }
    return {directory::ldapErrorDomain, code, std::move(text)};
}

Error ldapError(int code, std::string_view what, LDAP* ldap) {
    char* words = nullptr;
    if (ldap != nullptr) {
        ::ldap_get_option(ldap, LDAP_OPT_DIAGNOSTIC_MESSAGE, &words);
    }
    const LdapText owned(words);
    return ldapError(code, what, std::string_view(words == nullptr ? "" : words));
}

bool isUnreachable(std::int64_t code) noexcept {
    switch (code) {
        case LDAP_SERVER_DOWN:
        case LDAP_CONNECT_ERROR:
        case LDAP_TIMEOUT:
        case LDAP_LOCAL_ERROR:  // also: no Kerberos ticket for this server
        case LDAP_DECODING_ERROR:
        case LDAP_BUSY:
        case LDAP_UNAVAILABLE:
            return true;
        default:
            return false;
    }
}

}  // namespace adminhost
