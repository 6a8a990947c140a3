find_package(OpenSSL REQUIRED)
target_link_libraries(adminhost PRIVATE OpenSSL::Crypto)
