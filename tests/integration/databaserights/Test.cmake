set(TEST_LIBS settings)
# What a database can have the tool load.
add_library(intruding_extension MODULE ${CMAKE_CURRENT_SOURCE_DIR}/support/fixtures/IntrudingExtension.cpp)
target_link_libraries(intruding_extension PRIVATE room_options)
# The tool has no sanitizer, which a library with one needs.
target_compile_options(intruding_extension PRIVATE -fno-sanitize=all)
target_link_options(intruding_extension PRIVATE -fno-sanitize=all)
set(TEST_DEPENDS intruding_extension)
set(TEST_DEFINITIONS EXTENSION="$<TARGET_FILE:intruding_extension>")
