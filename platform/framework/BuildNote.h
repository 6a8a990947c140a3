#pragma once

// The build note: which plug-in interface and which kind of build a plug-in belongs to, readable from its file without
// running any of its code.
//
// The note is an ordinary ELF note of the name "adminhost", so it survives stripping and `readelf -n` shows it.

#include "platform/framework/Export.h"

#include <cstddef>
#include <cstdint>
#include <string_view>

/// The number of the plug-in interface. Raise it when Plugin.h, or the layout of a type that it uses, changes.
#define ADMINHOST_PLUGIN_INTERFACE 1

#define ADMINHOST_TEXT_OF(number) #number
#define ADMINHOST_TEXT(number) ADMINHOST_TEXT_OF(number)

// The layout of the library's strings and containers. It is the same in all compilers since 2015, unless a build asks
// for another.
#if !defined(__GLIBCXX__)
#define ADMINHOST_CXX_ABI "another library"
#elif defined(_GLIBCXX_DEBUG)
#define ADMINHOST_CXX_ABI "libstdc++ debug"
#elif _GLIBCXX_USE_CXX11_ABI
#define ADMINHOST_CXX_ABI "libstdc++ cxx11"
#else
#define ADMINHOST_CXX_ABI "libstdc++ old"
#endif

#ifdef ADMINHOST_SANITIZED
#define ADMINHOST_BUILD_FLAVOUR ", sanitized"
#else
#define ADMINHOST_BUILD_FLAVOUR ""
#endif

/// Identity of a build: plug-in interface, C++ ABI and whether it is a checking build. Neither the release nor the
/// compiler's version is part of it, so that a plug-in that is packaged separately still loads after an update of
/// either.
#define ADMINHOST_BUILD_IDENTITY \
    "adminhost interface " ADMINHOST_TEXT(ADMINHOST_PLUGIN_INTERFACE) ", " ADMINHOST_CXX_ABI ADMINHOST_BUILD_FLAVOUR

namespace adminhost {

inline constexpr int pluginInterface = ADMINHOST_PLUGIN_INTERFACE;

constexpr std::size_t buildIdentityMaximum = 128;  ///< bytes of the identity, its ending zero included
constexpr std::uint32_t buildNoteType = 1;
constexpr std::string_view buildNoteName = "adminhost";

/// The note as it is in the file: the header of an ELF note, its name padded to four bytes, the identity.
struct ADMINHOST_EXPORT BuildNote {
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
