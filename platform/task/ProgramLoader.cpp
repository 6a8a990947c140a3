#include "platform/task/ProgramLoader.h"

#include "platform/files/FileDescriptor.h"

#include <array>
#include <climits>
#include <cstddef>
#include <cstring>
#include <string_view>

#include <fcntl.h>
#include <link.h>
#include <unistd.h>

namespace adminhost {
namespace {

/// Fills the object from this place of the file.
template <typename Object>
bool readAt(int file, std::size_t offset, Object& object) {
    return ::pread(file, &object, sizeof object, static_cast<off_t>(offset)) == static_cast<ssize_t>(sizeof object);
}

}  // namespace

std::optional<std::string> loaderOf(const DiskPath& program) {
    constexpr unsigned char nativeClass = sizeof(void*) == 8 ? ELFCLASS64 : ELFCLASS32;
    const FileDescriptor file(::open(program.c_str(), O_RDONLY | O_NONBLOCK | O_CLOEXEC));
    ElfW(Ehdr) head{};
    if (!file.isOpen() || !readAt(file.get(), 0, head) || std::memcmp(head.e_ident, ELFMAG, SELFMAG) != 0 ||
        head.e_ident[EI_CLASS] != nativeClass || head.e_phentsize != sizeof(ElfW(Phdr))) {
        return std::nullopt;
    }
    for (std::size_t i = 0; i < head.e_phnum; ++i) {
        ElfW(Phdr) segment{};
        if (!readAt(file.get(), head.e_phoff + i * sizeof segment, segment)) {
            return std::nullopt;
        }
        if (segment.p_type != PT_INTERP) {
            continue;
        }
        std::array<char, PATH_MAX> text{};
        const auto size = static_cast<std::size_t>(segment.p_filesz);
        if (size >= text.size() || ::pread(file.get(), text.data(), size, static_cast<off_t>(segment.p_offset)) !=
                                       static_cast<ssize_t>(size)) {
            return std::nullopt;
        }
        return std::string(text.data());
    }
    return std::string();
}

}  // namespace adminhost
