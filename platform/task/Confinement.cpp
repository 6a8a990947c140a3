#include "platform/task/Confinement.h"

#include <algorithm>
#include <cerrno>
#include <system_error>

#include <fcntl.h>
#include <linux/landlock.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

namespace adminhost {
namespace {

// Numbers of the kernel that its headers of Debian 12 do not have.
constexpr std::uint64_t truncateFiles = 1U << 14U;      // since version 3
constexpr std::uint64_t controlDevices = 1U << 15U;     // since version 5
constexpr std::uint64_t tcp = 0b11;                     // bind and connect, since version 4
constexpr std::uint64_t abstractSocketsSignals = 0b11;  // since version 6
constexpr int versionOfTcp = 4;
constexpr int versionOfScopes = 6;

/// The kernel's attributes of a ruleset. Older kernels know a beginning of it.
struct RulesetAttributes {
    std::uint64_t files = 0;
    std::uint64_t network = 0;
    std::uint64_t scopes = 0;
};

constexpr std::uint64_t ofFiles = LANDLOCK_ACCESS_FS_EXECUTE | LANDLOCK_ACCESS_FS_WRITE_FILE |
                                  LANDLOCK_ACCESS_FS_READ_FILE | truncateFiles | controlDevices;
constexpr std::uint64_t readAccess = LANDLOCK_ACCESS_FS_READ_FILE | LANDLOCK_ACCESS_FS_READ_DIR;
constexpr std::uint64_t writeAccess = readAccess | LANDLOCK_ACCESS_FS_WRITE_FILE | truncateFiles |
                                      LANDLOCK_ACCESS_FS_MAKE_REG | LANDLOCK_ACCESS_FS_REMOVE_FILE;

/// The version of the kernel's interface; less than 1 without Landlock.
int version() noexcept {
    return static_cast<int>(
        ::syscall(SYS_landlock_create_ruleset, nullptr, std::size_t{0}, LANDLOCK_CREATE_RULESET_VERSION));
}

/// The kinds of access to files that a kernel with this version can refuse.
std::uint64_t filesKnownTo(int version) noexcept {
    constexpr int sinceVersion[] = {13, 14, 15, 15, 16};  // how many bits; the last for all later versions
    const auto last = static_cast<int>(std::size(sinceVersion));
    return (std::uint64_t{1} << static_cast<unsigned>(sinceVersion[std::min(version, last) - 1])) - 1;
}

std::uint64_t bitsOf(Confinement::Access access) noexcept {
    switch (access) {
        case Confinement::Access::read:
            return readAccess;
        case Confinement::Access::execute:
            return readAccess | LANDLOCK_ACCESS_FS_EXECUTE;
        case Confinement::Access::write:
            return writeAccess;
    }
    return 0;
}

}  // namespace

bool Confinement::isAvailable() noexcept {
    return version() >= 1;
}

Result<Confinement> Confinement::create() {
    const int known = version();
    RulesetAttributes attributes;
    std::size_t size = sizeof attributes.files;
    if (known >= 1) {
        attributes.files = filesKnownTo(known);
        if (known >= versionOfTcp) {
            attributes.network = tcp;
            size += sizeof attributes.network;
        }
        if (known >= versionOfScopes) {
            attributes.scopes = abstractSocketsSignals;
            size += sizeof attributes.scopes;
        }
        FileDescriptor ruleset(static_cast<int>(::syscall(SYS_landlock_create_ruleset, &attributes, size, 0)));
        if (ruleset.isOpen()) {
            return Confinement(std::move(ruleset), attributes.files);
        }
    }
    return failure(Error{"posix", errno, std::generic_category().message(errno)});
}

int Confinement::allow(int descriptor, Access access) const noexcept {
    struct stat status {};
    if (::fstat(descriptor, &status) != 0) {
        return errno;
    }
    landlock_path_beneath_attr rule{};
    rule.allowed_access = bitsOf(access) & _known & (S_ISDIR(status.st_mode) ? ~std::uint64_t{0} : ofFiles);
    rule.parent_fd = descriptor;
    return ::syscall(SYS_landlock_add_rule, _ruleset.get(), LANDLOCK_RULE_PATH_BENEATH, &rule, 0) == 0 ? 0 : errno;
}

int Confinement::allowIfPresent(const std::string& path, Access access) const noexcept {
    const FileDescriptor place(::open(path.c_str(), O_PATH | O_CLOEXEC));
    if (!place.isOpen()) {
        return errno == ENOENT || errno == ENOTDIR ? 0 : errno;
    }
    return allow(place.get(), access);
}

}  // namespace adminhost
