find_package(OpenSSL REQUIRED)
set(TEST_LIBS host OpenSSL::Crypto)
set(TEST_DEPENDS adminhost_lumio)
set(TEST_DEFINITIONS PLUGIN="$<TARGET_FILE:adminhost_lumio>")
