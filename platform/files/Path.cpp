#include "platform/files/Path.h"

#include "platform/files/FileDescriptor.h"

#include <algorithm>
#include <array>
#include <climits>
#include <optional>
#include <string_view>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

std::string root = "/";

/// The path without those steps "..", counted along its text, that would lead above its beginning. Other steps are
/// kept, so that a link on the way has the same meaning as for the system.
std::string withinRoot(std::string_view path) {
    std::string kept;
    std::size_t depth = 0;
    while (!path.empty()) {
        const std::size_t begin = std::min(path.find_first_not_of('/'), path.size());
        const std::size_t end = std::min(path.find('/', begin), path.size());
        const std::string_view step = path.substr(begin, end - begin);
        const bool up = step == "..";
        if (!up || depth > 0) {
            kept += path.substr(0, end);
        }
        if (up) {
            depth -= depth > 0 ? 1U : 0U;
        } else if (!step.empty() && step != ".") {
            ++depth;
        }
        path.remove_prefix(end);
    }
    return kept;
}

/// The path of the place without links; nullopt if it does not exist or cannot be known.
std::optional<std::string> placeOf(const char* path) {
    // Only the place is opened, which also works for files that this process may not read, and never waits for a pipe.
    const FileDescriptor place(::open(path, O_PATH | O_CLOEXEC));
    std::array<char, PATH_MAX> text;
    const ssize_t length =
        place.isOpen() ? ::readlink(("/proc/self/fd/" + std::to_string(place.get())).c_str(), text.data(), text.size())
                       : -1;
    return length <= 0 || static_cast<std::size_t>(length) == text.size()
               ? std::nullopt
               : std::optional<std::string>(std::in_place, text.data(), static_cast<std::size_t>(length));
}

}  // namespace

void setSystemRoot(std::string directory) {
    while (directory.size() > 1 && directory.back() == '/') {
        directory.pop_back();
    }
    root = directory.empty() ? "/" : std::move(directory);
}

const std::string& systemRoot() noexcept {
    return root;
}

DiskPath diskPath(const HostPath& path) {
    if (root == "/" || path.text().empty()) {
        return DiskPath(path.text());
    }
    std::string within = withinRoot(path.text());
    return DiskPath(root + (within.starts_with('/') ? "" : "/") + within);
}

HostPath hostPath(const DiskPath& path) {
    const std::string& text = path.text();
    if (root == "/" || !text.starts_with(root) || text.size() <= root.size() || text[root.size()] != '/') {
        return HostPath(text);
    }
    return HostPath(text.substr(root.size()));
}

bool isBelowSystemRoot(const DiskPath& path) {
    if (root == "/") {
        return exists(path);
    }
    const auto place = path.text().find('\0') == std::string::npos ? placeOf(path.c_str()) : std::nullopt;
    const auto top = place ? placeOf(root.c_str()) : std::nullopt;
    return top && place->starts_with(*top) && (place->size() == top->size() || (*place)[top->size()] == '/');
}

bool exists(const DiskPath& path) noexcept {
    struct stat status {};
    // The system would look at the part before a NUL.
    return path.text().find('\0') == std::string::npos && ::stat(path.c_str(), &status) == 0;
}

}  // namespace adminhost
