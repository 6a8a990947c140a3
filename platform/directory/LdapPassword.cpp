#include "platform/directory/LdapPassword.h"

#include "platform/crypto/Crypt.h"
#include "platform/files/FileDescriptor.h"

#include <cerrno>
#include <cstring>
#include <string_view>

#include <fcntl.h>
#include <fmt/format.h>
#include <ldap.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

constexpr std::size_t maximumSize = 4096;  ///< bytes

Error unusable(const std::string& path, std::string_view why) {
    return {directory::ldapErrorDomain, LDAP_LOCAL_ERROR, fmt::format("{}: {}", path, why)};
}

}  // namespace

Result<std::string> ldapBindPassword(const LdapNodeSettings& settings) {
    const bool isFile = settings.bindPasswordFile.has_value();
    if (!isFile && !settings.credentialsDirectory) {
        return failure(unusable(settings.bindPasswordCredential,
                                "the service manager has not given this credential; set LoadCredential= in the unit"));
    }
    const DiskPath path = isFile
                              ? diskPath(*settings.bindPasswordFile)
                              : DiskPath(settings.credentialsDirectory->text() + "/" + settings.bindPasswordCredential);
    const std::string shown = isFile ? settings.bindPasswordFile->text() : path.text();
    // A pipe is not waited for.
    const FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY));
    struct stat status {};
    if (!file.isOpen() || ::fstat(file.get(), &status) != 0) {
        return failure(unusable(shown, std::strerror(errno)));
    }
    if (!S_ISREG(status.st_mode)) {
        return failure(unusable(shown, "not a regular file"));
    }
    // The service manager protects its credentials in its own way.
    if (isFile && (status.st_mode & 077U) != 0) {
        return failure(unusable(shown, "group or others have access; set its mode to 0600"));
    }
    std::string read(maximumSize + 1, '\0');
    const ScopedCleanse wipeRead(read);
    const ssize_t size = ::read(file.get(), read.data(), read.size());
    if (size < 0) {
        return failure(unusable(shown, std::strerror(errno)));
    }
    std::string_view password = std::string_view(read).substr(0, static_cast<std::size_t>(size));
    for (const char end : {'\n', '\r'}) {
        if (password.ends_with(end)) {
            password.remove_suffix(1);
        }
    }
    if (password.empty() || password.size() > maximumSize - 2) {
        return failure(
            unusable(shown, password.empty() ? "the file is empty" : "the file is too large for a password"));
    }
    return std::string(password);
}

}  // namespace adminhost
