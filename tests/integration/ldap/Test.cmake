find_package(OpenSSL REQUIRED)
pkg_check_modules(LDAP REQUIRED IMPORTED_TARGET ldap lber)
set(TEST_LIBS OpenSSL::Crypto PkgConfig::LDAP)
