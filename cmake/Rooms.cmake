# Flags that every room shares, and the helpers that declare rooms and their tests.

add_library(room_options INTERFACE)
target_include_directories(room_options INTERFACE ${CMAKE_SOURCE_DIR} ${CMAKE_BINARY_DIR}/generated)
target_compile_options(room_options INTERFACE
    -Wall -Wextra -Wpedantic -Werror -Wshadow -Wnon-virtual-dtor -Wold-style-cast -Woverloaded-virtual
    -Wformat=2 -Wundef -fstack-protector-strong)
target_link_options(room_options INTERFACE -Wl,-z,relro,-z,now -Wl,--as-needed)
# compile_together(TARGET WHETHER): several of a target's files at a time, which then see each other's names.
function(compile_together target whether)
    if(whether)
        # Linked last, because it takes back warnings.
        target_link_libraries(${target} PRIVATE compiled_together)
        set_target_properties(${target} PROPERTIES UNITY_BUILD ON UNITY_BUILD_BATCH_SIZE 4)
    endif()
endfunction()
add_library(compiled_together INTERFACE)
target_compile_options(compiled_together INTERFACE -Wno-shadow $<$<CXX_COMPILER_ID:GNU>:-Wno-subobject-linkage>)
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

# adminhost_room(NAME [APART] SOURCES... LIBS...): a static library of a room's sources. APART is for one of which programs link
# single files: they are never compiled together.
function(adminhost_room name)
    cmake_parse_arguments(ROOM "APART" "" "SOURCES;LIBS" ${ARGN})
    add_library(${name} STATIC ${ROOM_SOURCES})
    target_link_libraries(${name} PUBLIC room_options ${ROOM_LIBS})
    if(NOT ROOM_APART)
        compile_together(${name} ${ADMINHOST_ROOMS_TOGETHER})
    endif()
endfunction()
