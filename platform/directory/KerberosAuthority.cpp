#include "platform/directory/KerberosAuthority.h"

#include <fmt/format.h>

namespace adminhost {

std::string kerberosPrincipalOf(std::string_view name, std::string_view realm) {
    std::string principal;
    for (const char c : name) {
        if (c == '@' || c == '/' || c == '\\') {
            principal += '\\';
        }
        principal += c;
    }
    principal += '@';
    principal += realm;
    return principal;
}

std::optional<std::string> kerberosAuthority(std::string_view principal, std::string_view defaultRealm) {
    if (principal.empty() || principal.find(';') != std::string_view::npos) {
        return std::nullopt;
    }
    std::string_view realm = defaultRealm;
    for (std::size_t i = 0; i < principal.size(); ++i) {
        if (principal[i] == '\\') {
            ++i;
        } else if (principal[i] == '@') {
            realm = principal.substr(i + 1);
        }
    }
    return fmt::format(";Kerberosv5;;{};{};", principal, realm);
}

}  // namespace adminhost
