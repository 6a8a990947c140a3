# Flags that every room shares, and the helpers that declare rooms and their tests.

add_library(room_options INTERFACE)
target_include_directories(room_options INTERFACE ${CMAKE_SOURCE_DIR} ${CMAKE_BINARY_DIR}/generated)
target_compile_options(room_options INTERFACE
    -Wall -Wextra -Wpedantic -Werror -Wshadow -Wnon-virtual-dtor -Wold-style-cast -Woverloaded-virtual
    -Wformat=2 -Wundef -fstack-protector-strong)
target_link_options(room_options INTERFACE -Wl,-z,relro,-z,now -Wl,--as-needed)
# For targets whose files are compiled together, and see each other's names. Linked last, because it takes back a warning.
add_library(compiled_together INTERFACE)
if(ADMINHOST_TOGETHER)
    target_compile_options(compiled_together INTERFACE -Wno-shadow)
endif()
if(ADMINHOST_SANITIZE)
    # Instrumented code hides from GCC what is initialised; clang has no such warning.
    target_compile_options(room_options INTERFACE $<$<CXX_COMPILER_ID:GNU>:-Wno-maybe-uninitialized>)
    add_compile_options(-fsanitize=address,undefined -fno-sanitize-recover=all -fno-omit-frame-pointer)
    add_link_options(-fsanitize=address,undefined)
    add_compile_definitions(ADMINHOST_SANITIZED=1)
else()
    add_compile_options($<$<NOT:$<CONFIG:Debug>>:-D_FORTIFY_SOURCE=2>)
endif()

if(ADMINHOST_FUZZ)  # everything that a harness reaches reports its coverage
    add_compile_options(-fsanitize=fuzzer-no-link,address,undefined -fno-sanitize-recover=all -fno-omit-frame-pointer)
    add_link_options(-fsanitize=address,undefined)
endif()

# adminhost_room(NAME SOURCES... LIBS...): a static library of a room's sources.
function(adminhost_room name)
    cmake_parse_arguments(ROOM "" "" "SOURCES;LIBS" ${ARGN})
    add_library(${name} STATIC ${ROOM_SOURCES})
    target_link_libraries(${name} PUBLIC room_options ${ROOM_LIBS})
endfunction()
