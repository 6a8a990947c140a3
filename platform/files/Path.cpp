#include "platform/files/Path.h"

#include <algorithm>
#include <string_view>

#include <sys/stat.h>

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

bool exists(const DiskPath& path) noexcept {
    struct stat status {};
    // The system would look at the part before a NUL.
    return path.text().find('\0') == std::string::npos && ::stat(path.c_str(), &status) == 0;
}

}  // namespace adminhost
