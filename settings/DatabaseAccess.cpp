#include "settings/DatabaseAccess.h"

#include "platform/task/AccountRights.h"
#include "platform/task/ProgramLoader.h"
#include "platform/task/Task.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <chrono>
#include <filesystem>
#include <map>
#include <system_error>
#include <utility>

#include <pwd.h>
#include <sys/stat.h>
#include <unistd.h>

namespace lumio {

using adminhost::ChildRights;
using adminhost::Confinement;
using adminhost::DiskPath;
using adminhost::FileRoute;
using adminhost::HostPath;
using adminhost::PathStep;
using Access = Confinement::Access;

namespace {

constexpr mode_t writableByOthers = S_IWGRP | S_IWOTH;

/// The words that name an account in messages.
std::string accountText(uid_t user) {
    passwd entry{};
    passwd* found = nullptr;
    std::array<char, 16384> buffer;  // not initialised: the C library fills the used part
    const int failure = ::getpwuid_r(user, &entry, buffer.data(), buffer.size(), &found);
    return failure == 0 && found != nullptr ? std::string("the account ") + entry.pw_name
                                            : "the user id " + std::to_string(user);
}

/// Returns true if only root can create, replace or remove this entry of the directory. In a directory with the sticky
/// bit, only an entry's owner can.
bool isOnlyRoots(const PathStep& step) {
    return adminhost::isOfRootOrOutside(step.directory) &&
           ((step.directory.st_mode & writableByOthers) == 0 ||
            ((step.directory.st_mode & S_ISVTX) != 0 && adminhost::isOfRoot(step.entry)));
}

bool isOnlyRoots(const struct stat& file) {
    return adminhost::isOfRoot(file) && (file.st_mode & writableByOthers) == 0;
}

/// Returns true if the step follows a link that someone other than root and this account may have created.
bool isLinkOfOthers(const PathStep& step, uid_t account) {
    return S_ISLNK(step.entry.st_mode) &&
           ((step.directory.st_mode & writableByOthers) != 0 ||
            (!adminhost::isOfRootOrOutside(step.directory) && step.directory.st_uid != account));
}

using Clock = std::chrono::steady_clock;
using Identity = std::pair<dev_t, ino_t>;

constexpr auto keptTime = std::chrono::seconds(1);

Identity identityOf(const std::string& path) noexcept {
    struct stat status {};
    return !path.empty() && ::stat(path.c_str(), &status) == 0 ? Identity{status.st_dev, status.st_ino} : Identity();
}

/// What a confinement allows beside fixed places. While the confinement exists, no other file can get these numbers.
struct ConfinedFiles {
    DiskPath tool;
    Identity program;
    Identity loader;
    Identity directory;
    std::map<std::string, std::string> configuration;

    bool operator==(const ConfinedFiles&) const = default;
};

struct KeptConfinement {
    ConfinedFiles files;
    std::string loader;
    std::shared_ptr<const Confinement> confinement;
    Clock::time_point until;  ///< fixed places such as the time zone may be replaced
};

}  // namespace

tl::expected<DatabaseAccess, DatabaseRefusal> DatabaseAccess::of(const HostPath& database) {
    const auto refused = [](std::string reason, std::string fix) {
        return tl::unexpected(DatabaseRefusal{std::move(reason), std::move(fix)});
    };
    const std::string& path = database.text();
    DatabaseAccess access;
    FileRoute& route = access._route;
    const int failure = adminhost::openRoute(adminhost::diskPath(database), route);
    if (::geteuid() != 0) {
        return access;  // of a path that cannot be followed, the tool itself says why
    }
    if (failure != 0) {
        return refused(path + ": " + std::generic_category().message(failure), "correct the path of the database");
    }
    const struct stat& owned = route.file ? *route.file : route.directoryStatus;
    const uid_t owner = owned.st_uid;
    if (std::any_of(route.steps.begin(), route.steps.end(),
                    [&](const PathStep& step) { return isLinkOfOthers(step, owner); })) {
        return refused("others than root and the owner of " + path + " can change a link on its path",
                       "use the path without the link, or remove the others' right to write its directory");
    }
    if (!adminhost::isOfRoot(owned)) {
        auto rights = adminhost::rightsOfAccount(owner);
        if (!rights) {
            return refused("the user id " + std::to_string(owner) + ", which owns " + path +
                               ", cannot be looked up: " + adminhost::textOf(rights.error().description),
                           "try again later");
        }
        if (!adminhost::mayCreateFiles(*rights, route.directoryStatus)) {
            return refused(path + " belongs to " + accountText(owner) + ", which cannot create files in its directory",
                           "give the directory to the account that the service runs as");
        }
        access._account = *std::move(rights);
        return access;
    }
    // The directory itself counts although the file is already in it: the tool creates its journals there.
    if (!std::all_of(route.steps.begin(), route.steps.end(), [](const PathStep& step) { return isOnlyRoots(step); }) ||
        !isOnlyRoots(route.directoryStatus) || !isOnlyRoots(owned)) {
        return refused(path + " belongs to root, but others can write it, or a directory on its path",
                       "give the file and its directory to the account that the service runs as, or let only root "
                       "write them (chmod go-w)");
    }
    return access;
}

std::string DatabaseAccess::directory() const {
    if (!_route.directory.isOpen() || _route.missesDirectory) {
        return {};
    }
    std::error_code failed;
    return std::filesystem::read_symlink("/proc/self/fd/" + std::to_string(_route.directory.get()), failed).string();
}

adminhost::Result<std::shared_ptr<const Confinement>> DatabaseAccess::confine(const DiskPath& tool) const {
    // A listing runs many statements: they share a confinement of the same files.
    thread_local KeptConfinement kept;
    ConfinedFiles files{tool, identityOf(tool.text()), {}, {}, adminhost::toolFileVariables()};
    if (_route.directory.isOpen() && !_route.missesDirectory) {
        files.directory = {_route.directoryStatus.st_dev, _route.directoryStatus.st_ino};
    }
    files.loader = identityOf(kept.loader);
    if (Clock::now() < kept.until && files == kept.files) {
        return kept.confinement;
    }
    const auto loader = adminhost::loaderOf(tool);
    if (!loader || !Confinement::isAvailable()) {
        return nullptr;
    }
    auto made = confineNow(tool, *loader);
    if (made) {
        files.loader = identityOf(*loader);
        kept = {std::move(files), *loader, *made, Clock::now() + keptTime};
    }
    return made;
}

adminhost::Result<std::shared_ptr<const Confinement>> DatabaseAccess::confineNow(const DiskPath& tool,
                                                                                 const std::string& loader) const {
    auto confinement = Confinement::create();
    if (!confinement) {
        return adminhost::failure(confinement.error());
    }
    int failure = 0;
    const auto allow = [&](const std::string& path, Access access) {
        failure = failure != 0 ? failure : confinement->allowIfPresent(path, access);
    };
    allow(tool.text(), Access::execute);
    if (!loader.empty()) {
        allow(loader, Access::execute);
    }
    for (const char* libraries :
         {"/usr/lib", "/usr/lib64", "/lib", "/lib64", "/usr/local/lib", "/etc/ld.so.cache", "/etc/ld.so.preload"}) {
        allow(libraries, Access::read);
    }
    for (const char* timeZones : {"/etc/localtime", "/usr/share/zoneinfo"}) {
        allow(timeZones, Access::read);
    }
    allow("/dev/null", Access::write);
    allow("/dev/urandom", Access::read);
    for (const auto& [name, configuration] : adminhost::toolFileVariables()) {
        allow(configuration, Access::read);
    }
    if (failure == 0 && _route.directory.isOpen() && !_route.missesDirectory) {
        failure = confinement->allow(_route.directory.get(), Access::write);
    }
    if (failure != 0) {
        return adminhost::failure(adminhost::Error{"posix", failure, std::generic_category().message(failure)});
    }
    return std::make_shared<const Confinement>(*std::move(confinement));
}

}  // namespace lumio
