find_package(OpenSSL REQUIRED)
find_package(ICU REQUIRED COMPONENTS uc)
pkg_check_modules(LDAP REQUIRED IMPORTED_TARGET ldap lber)
pkg_check_modules(KRB5 REQUIRED krb5 krb5-gssapi)
# Its pkg-config file gives the directory as a plain flag, which an imported target has in another place after the first
# configuration: everything would be compiled again.
find_path(KRB5_HEADERS krb5.h PATH_SUFFIXES mit-krb5 REQUIRED)
add_library(kerberos INTERFACE)
target_include_directories(kerberos SYSTEM INTERFACE ${KRB5_HEADERS})
target_link_libraries(kerberos INTERFACE ${KRB5_LINK_LIBRARIES})
target_link_libraries(adminhost PRIVATE OpenSSL::Crypto ICU::uc PkgConfig::LDAP kerberos)
