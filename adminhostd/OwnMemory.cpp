#include "adminhostd/OwnMemory.h"

#include <charconv>
#include <string_view>
#include <system_error>

#include <fcntl.h>
#include <unistd.h>

namespace adminhost {

OwnMemory::OwnMemory() noexcept : _file(::open("/proc/self/statm", O_RDONLY | O_CLOEXEC)) {}

std::optional<std::uint64_t> OwnMemory::bytes() const noexcept {
    char text[256];
    const ssize_t size = ::pread(_file.get(), text, sizeof text, 0);
    const std::string_view fields(text, size < 0 ? 0 : static_cast<std::size_t>(size));
    const std::size_t second = fields.find(' ');
    std::uint64_t pages = 0;
    if (second == std::string_view::npos ||
        std::from_chars(fields.data() + second + 1, fields.data() + fields.size(), pages).ec != std::errc()) {
        return std::nullopt;
    }
    return pages * static_cast<std::uint64_t>(::sysconf(_SC_PAGESIZE));
}

}  // namespace adminhost
