#include "platform/files/Path.h"

#include <sys/stat.h>

namespace adminhost {
namespace {

std::string root = "/";

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
    if (root == "/" || !path.text().starts_with('/')) {
        return DiskPath(path.text());
    }
    return DiskPath(root + path.text());
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
    // The system would look at what stands before a NUL.
    return path.text().find('\0') == std::string::npos && ::stat(path.c_str(), &status) == 0;
}

}  // namespace adminhost
