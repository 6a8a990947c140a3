find_package(ICU REQUIRED COMPONENTS uc)
target_link_libraries(adminhost PRIVATE ICU::uc)
