#include "adminhostd/ConfigurationCopy.h"

#include <cerrno>
#include <stdexcept>
#include <system_error>

#include <fcntl.h>
#include <sys/mman.h>
#include <sys/stat.h>
#include <sys/types.h>
#include <unistd.h>

namespace adminhost {

FileDescriptor sealedCopyOf(const ConfigurationText& configuration) {
    // A path holds no NUL.
    const std::string content = configuration.path + '\0' + configuration.text;
    FileDescriptor copy(::memfd_create("adminhost-configuration", MFD_CLOEXEC | MFD_ALLOW_SEALING));
    if (!copy.isOpen() || ::write(copy.get(), content.data(), content.size()) != static_cast<ssize_t>(content.size()) ||
        ::fcntl(copy.get(), F_ADD_SEALS, F_SEAL_WRITE | F_SEAL_SHRINK | F_SEAL_GROW | F_SEAL_SEAL) != 0) {
        throw std::system_error(errno, std::generic_category(), "cannot copy the configuration");
    }
    return copy;
}

ConfigurationText configurationIn(int copy) {
    struct stat status {};
    std::string content;
    if (::fstat(copy, &status) == 0) {
        content.resize(static_cast<std::size_t>(status.st_size));
    }
    const std::size_t end = ::pread(copy, content.data(), content.size(), 0) == static_cast<ssize_t>(content.size())
                                ? content.find('\0')
                                : std::string::npos;
    if (end == std::string::npos) {
        throw std::runtime_error("the monitor's copy of the configuration cannot be read");
    }
    return {content.substr(0, end), content.substr(end + 1)};
}

}  // namespace adminhost
