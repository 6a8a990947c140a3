#include "adminhostd/FrontChecks.h"

#include "adminhostd/PluginFile.h"
#include "adminhostd/RunDirectory.h"
#include "adminhostd/UnitProcesses.h"
#include "platform/log/Log.h"
#include "platform/release/Release.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <exception>
#include <filesystem>
#include <string_view>
#include <system_error>
#include <utility>

#include <fmt/chrono.h>
#include <fmt/format.h>
#include <fmt/ranges.h>
#include <unistd.h>

namespace adminhost {
namespace {

using Health = Diagnosis::Health;

constexpr std::uint64_t megabyte = 1'000'000;
constexpr std::uint64_t scarceBytes = 100 * megabyte;
constexpr std::uint64_t fullBytes = 10 * megabyte;
constexpr std::uint64_t scarceFiles = 1000;

/// Created by systemd-timesyncd when it has set the clock; may be looked for without any right.
constexpr const char* synchronised = "/run/systemd/timesync/synchronized";

/// The number alone: the front must not wait for a directory service to name an account.
std::string ownerText(uid_t uid) {
    return uid == 0 ? "root" : fmt::format("uid {}", uid);
}

std::string groupText(gid_t gid) {
    return gid == 0 ? "root" : fmt::format("gid {}", gid);
}

std::string errorText(int number) {
    return std::generic_category().message(number);
}

/// A sentence with its fix, "what is wrong; what to do", as a check.
Diagnosis failureOf(std::string name, const std::string& sentence) {
    const std::size_t end = sentence.rfind("; ");
    return {Health::failure, std::move(name), sentence.substr(0, end) + '.',
            end == std::string::npos ? std::string() : sentence.substr(end + 2)};
}

Diagnosis workerCheck(const FrontChecks::Workers& workers) {
    if (workers.problem) {
        return {Health::failure, "worker", "No worker is running. " + *workers.problem,
                "see the daemon's log (journalctl -u adminhostd); the daemon tries again by itself"};
    }
    if (!workers.pid) {
        return {Health::warning, "worker", "A worker is being started.", "run the check again"};
    }
    return {Health::ok, "worker", fmt::format("The worker is running (process {}).", *workers.pid), ""};
}

Diagnosis pluginCheck(const FrontChecks::Workers& workers) {
    if (!workers.refused.empty()) {
        std::string reasons;
        for (const protocol::RefusedPlugin& plugin : workers.refused) {
            reasons += (reasons.empty() ? "" : " ") + plugin.reason + '.';
        }
        return {Health::failure, "plug-ins", "Not loaded: " + reasons,
                "install the plug-in of this release, and restart the daemon"};
    }
    if (workers.plugins.empty()) {
        return {Health::failure, "plug-ins", "No plug-in is loaded, so the daemon has no commands.",
                "adminhostd --check shows why"};
    }
    return {Health::ok, "plug-ins", fmt::format("Loaded: {}.", fmt::join(workers.plugins, ", ")), ""};
}

Diagnosis directoryCheck(const std::string& what, const std::string& path) {
    struct stat status {};
    if (::stat(path.c_str(), &status) != 0) {
        if (errno == ENOENT) {
            return {Health::ok, what, path + " does not exist yet.", ""};
        }
        return {Health::failure, what, path + ": " + errorText(errno) + '.', "make it accessible for the daemon"};
    }
    if (!S_ISDIR(status.st_mode)) {
        return {Health::failure, what, path + " is not a directory.", "remove it, and restart the daemon"};
    }
    if (const auto problem = distrust(DiskPath(path))) {
        return failureOf(what, *problem);
    }
    return {Health::ok, what,
            fmt::format("{} belongs to {}:{}, mode {:04o}.", path, ownerText(status.st_uid), groupText(status.st_gid),
                        status.st_mode & 07777U),
            ""};
}

Diagnosis spaceOf(const std::string& what, const std::string& path) {
    // The nearest directory that exists.
    std::filesystem::path place = path;
    std::error_code ignored;
    while (!std::filesystem::exists(place, ignored) && place.has_relative_path()) {
        place = place.parent_path();
    }
    struct statvfs space {};
    if (::statvfs(place.c_str(), &space) != 0) {
        return {Health::warning, "free space, " + what, path + ": " + errorText(errno) + '.', "check the file system"};
    }
    return spaceCheck("free space, " + what, path, space);
}

/// journald drops events without a word to their senders when its disk is full.
Diagnosis journalSpaceCheck() {
    const std::string name = "free space, journal";
    for (const char* place : {"/var/log/journal", "/run/log/journal"}) {
        struct statvfs space {};
        if (::statvfs(place, &space) == 0) {
            return spaceCheck(name, place, space, "The journal drops events.");
        }
        if (errno != ENOENT) {
            return {Health::warning, name, fmt::format("{}: {}.", place, errorText(errno)), "check the file system"};
        }
    }
    return {Health::ok, name, "The journal is not stored on this machine.", ""};
}

Diagnosis unitCheck() {
    const char* const mainProcess = std::getenv("SYSTEMD_EXEC_PID");
    const UnitProcesses unit = unitProcesses(::getppid(), mainProcess == nullptr ? "" : mainProcess);
    if (unit.unit.empty()) {
        return {Health::ok, "unit", "The daemon does not run as a unit of systemd.", ""};
    }
    if (unit.strays.empty()) {
        return {Health::ok, "unit", fmt::format("Only the daemon's own processes run in {}.", unit.unit), ""};
    }
    std::string names;
    for (const UnitProcess& process : unit.strays) {
        names += fmt::format("{}{} ({})", names.empty() ? "" : ", ", process.name, process.pid);
    }
    return {Health::warning, "unit",
            fmt::format("Processes run in {} that are not the daemon's: {}. A control tool has started them itself "
                        "instead of asking the service manager.",
                        unit.unit, names),
            "stop the service, and start it with systemctl; let its control tool call systemctl"};
}

}  // namespace

FrontChecks::Seen FrontChecks::Seen::now(const std::string& path) {
    Seen seen;
    struct stat status {};
    if (!path.empty() && ::lstat(path.c_str(), &status) == 0) {
        seen = {path, status.st_dev, status.st_ino};
    }
    return seen;
}

FrontChecks::FrontChecks(const Options& options) : _root(options.root), _socket(Seen::now(socketPath(options))) {
    reconfigure(options);
}

void FrontChecks::reconfigure(const Options& options) {
    _configuration = options.configuration;
    _configurationText = options.configurationText;
    _configurationIsNamed = options.configurationIsNamed;
    _directories = {{"run directory", privateParent(options)},
                    {"history directory", diskPath(HostPath("/var/lib/adminhostd")).text()}};
    if (options.plugins.empty()) {
        _directories.emplace_back("plug-in directory", diskPath(options.pluginDirectory).text());
    }
}

Diagnosis FrontChecks::daemonCheck() const {
    return {Health::ok, "daemon",
            fmt::format(
                "Release " ADMINHOST_RELEASE ", process {}, as {}{}, since {:%Y-%m-%d %H:%M:%S} UTC{}.", ::getppid(),
                ownerText(_account), ::geteuid() == _account ? "" : ", its front as " + ownerText(::geteuid()),
                fmt::gmtime(std::chrono::system_clock::to_time_t(_started)), _root == "/" ? "" : ", below " + _root),
            ""};
}

Diagnosis FrontChecks::socketCheck() const {
    struct stat status {};
    const bool exists = ::lstat(_socket.path.c_str(), &status) == 0;
    if (!exists && errno != ENOENT && errno != ENOTDIR) {
        return {Health::failure, "socket", fmt::format("{}: {}.", _socket.path, errorText(errno)),
                "make its directory accessible for the daemon"};
    }
    if (!exists || status.st_dev != _socket.device || status.st_ino != _socket.inode) {
        return {Health::failure, "socket",
                fmt::format("{} {}: new clients do not reach this daemon.", _socket.path,
                            exists ? "is not the daemon's any more" : "has been removed"),
                "restart the daemon, and find out what replaced or removed the socket"};
    }
    const std::string found = fmt::format("{} belongs to {}:{}, mode {:04o}.", _socket.path, ownerText(status.st_uid),
                                          groupText(status.st_gid), status.st_mode & 07777U);
    if ((status.st_mode & S_IRWXO) != 0) {
        return {Health::warning, "socket", found + " Every account can open it, and be refused by the daemon.",
                "chmod 0660 " + _socket.path};
    }
    return {Health::ok, "socket", found, ""};
}

Diagnosis FrontChecks::configurationCheck() const {
    if (_configuration.empty()) {
        return {Health::ok, "configuration file", "The daemon has no configuration file.", ""};
    }
    const DiskPath file(_configuration);
    if (const auto problem = _configurationIsNamed ? distrustNamed(file) : distrust(file)) {
        return failureOf("configuration file", *problem);
    }
    if (::access(file.c_str(), R_OK) != 0 && errno == EACCES) {
        return {Health::ok, "configuration file",
                fmt::format("{} is in effect as it was when the daemon read it. The front's account (uid {}) cannot "
                            "read it, so that this check does not notice changes.",
                            _configuration, ::geteuid()),
                ""};
    }
    try {
        Options read;
        readConfiguration(_configuration, read);
        if (read.configurationText != _configurationText) {
            return {Health::warning, "configuration file",
                    _configuration + " has changed since the daemon read it, and is not in effect.",
                    "reload the daemon (systemctl reload adminhostd)"};
        }
    } catch (const std::exception& error) {
        return {Health::failure, "configuration file",
                fmt::format("{}. The daemon would not start again with it.", error.what()), "correct the file"};
    }
    return {Health::ok, "configuration file", _configuration + " is in effect.", ""};
}

std::vector<Diagnosis> FrontChecks::run(const Workers& workers) const {
    std::vector<Diagnosis> checks{daemonCheck(), socketCheck(), configurationCheck(), workerCheck(workers),
                                  pluginCheck(workers)};
    for (const auto& [what, path] : _directories) {
        checks.push_back(directoryCheck(what, path));
    }
    for (const auto& [what, path] : _directories) {
        if (what != "plug-in directory") {
            checks.push_back(spaceOf(what, path));
        }
    }
    if (journalIsThere()) {
        checks.push_back(journalSpaceCheck());
    }
    checks.push_back(unitCheck());
    timex clock{};
    const int state = ::adjtimex(&clock);
    checks.push_back(clockCheck(state, clock, ::access(synchronised, F_OK) == 0));
    return checks;
}

Diagnosis clockCheck(int state, const timex& clock, bool reported) {
    if (state < 0 && reported) {
        return {Health::ok, "clock", "The time service has synchronised the clock.", ""};
    }
    if (state < 0) {
        return {Health::warning, "clock",
                "It is not known whether the clock is synchronised: the daemon may not ask the kernel, and "
                "systemd-timesyncd has not reported it.",
                "see whether timedatectl shows \"System clock synchronized: yes\"; in a container, do so on its host"};
    }
    if (state == TIME_ERROR || (static_cast<unsigned>(clock.status) & STA_UNSYNC) != 0) {
        return {
            Health::warning, "clock",
            "The clock is not synchronised with a time server. Kerberos rejects clocks that differ by more than five "
            "minutes.",
            "start a time service (systemctl enable --now systemd-timesyncd, or chrony)"};
    }
    return {Health::ok, "clock", "The clock is synchronised.", ""};
}

Diagnosis spaceCheck(const std::string& name, const std::string& directory, const struct statvfs& space,
                     const std::string& effect) {
    const std::uint64_t bytes = std::uint64_t{space.f_bavail} * space.f_frsize;
    const bool countsFiles = space.f_files > 0;
    const std::string found = fmt::format("{} MB are free for {}{}.", bytes / megabyte, directory,
                                          countsFiles ? fmt::format(", and {} files", space.f_favail) : "");
    const std::string fix = "remove files, or enlarge the file system";
    if (bytes < fullBytes || (countsFiles && space.f_favail == 0)) {
        return {Health::failure, name, found + ' ' + effect, fix};
    }
    if (bytes < scarceBytes || (countsFiles && space.f_favail < scarceFiles)) {
        return {Health::warning, name, found, fix};
    }
    return {Health::ok, name, found, ""};
}

}  // namespace adminhost
