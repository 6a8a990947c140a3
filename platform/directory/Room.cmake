find_package(OpenSSL REQUIRED)
find_package(ICU REQUIRED COMPONENTS uc)
target_link_libraries(adminhost PRIVATE OpenSSL::Crypto ICU::uc)
