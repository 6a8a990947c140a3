pkg_check_modules(AVAHI REQUIRED IMPORTED_TARGET avahi-client)
pkg_check_modules(SYSTEMD REQUIRED IMPORTED_TARGET libsystemd)
target_link_libraries(adminhost PRIVATE PkgConfig::AVAHI PkgConfig::SYSTEMD)
