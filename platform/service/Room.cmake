pkg_check_modules(SYSTEMD REQUIRED IMPORTED_TARGET libsystemd)
target_link_libraries(adminhost PRIVATE PkgConfig::SYSTEMD)
