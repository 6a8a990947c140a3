#pragma once

// The build note: which build a plug-in belongs to, readable from its file without running any of its code.
//
// It is an ordinary ELF note of the name "adminhost", so that it survives stripping and `readelf -n` shows it.

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace adminhost {

#ifdef ADMINHOST_SANITIZED
#define ADMINHOST_BUILD_FLAVOUR " sanitized"
#else
#define ADMINHOST_BUILD_FLAVOUR ""
#endif

/// Identity of the build: release, compiler interface and whether it is a checking build.
#define ADMINHOST_BUILD_IDENTITY "adminhost " ADMINHOST_RELEASE " " __VERSION__ ADMINHOST_BUILD_FLAVOUR

constexpr std::size_t buildIdentityMaximum = 128;  ///< bytes of the identity, its ending zero included
constexpr std::uint32_t buildNoteType = 1;
constexpr std::string_view buildNoteName = "adminhost";

/// The note as it lies in the file: the header of an ELF note, its name padded to four bytes, the identity.
struct BuildNote {
    std::uint32_t nameSize = 10;
    std::uint32_t descriptionSize = buildIdentityMaximum;
    std::uint32_t type = buildNoteType;
    char name[12] = {'a', 'd', 'm', 'i', 'n', 'h', 'o', 's', 't'};
    char identity[buildIdentityMaximum] = {};
};

consteval BuildNote makeBuildNote(std::string_view identity) {
    BuildNote note;
    for (std::size_t i = 0; i < identity.size(); ++i) {
        note.identity[i] = identity[i];  // a longer identity does not compile
    }
    note.identity[buildIdentityMaximum - 1] = 0;
    return note;
}

}  // namespace adminhost
