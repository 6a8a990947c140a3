#pragma once

#include <string>
#include <string_view>

namespace adminhost::test {

/// LDIF of a directory whose only person, "writer", may change the others (Slapd's rules).
[[nodiscard]] inline std::string administratorTree(std::string_view password) {
    return R"(dn: dc=nimbo,dc=test
objectClass: domain
dc: nimbo

dn: ou=people,dc=nimbo,dc=test
objectClass: organizationalUnit
ou: people

dn: uid=writer,ou=people,dc=nimbo,dc=test
objectClass: account
objectClass: simpleSecurityObject
uid: writer
userPassword: )" +
           std::string(password) + "\n\n";
}

}  // namespace adminhost::test
