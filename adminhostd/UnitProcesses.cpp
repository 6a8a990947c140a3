#include "adminhostd/UnitProcesses.h"

#include <charconv>
#include <fstream>
#include <optional>
#include <sstream>
#include <string_view>
#include <utility>

#include <fmt/format.h>

namespace adminhost {
namespace {

constexpr int deepest = 64;  ///< ancestors of a process that are looked at

/// What can be read of the file. A process that ends meanwhile is an error of reading, which the operator does not
/// throw.
std::string contentOf(const std::string& path) {
    const std::ifstream file(path);
    std::ostringstream text;
    text << file.rdbuf();
    return std::move(text).str();
}

std::string membersOf(const KernelPlaces& places, const std::string& group) {
    for (const char* hierarchy : {"", "/unified", "/systemd"}) {
        std::string members = contentOf(places.groups + hierarchy + group + "/cgroup.procs");
        if (!members.empty()) {
            return members;
        }
    }
    return {};
}

/// The name and the parent of a process; nullopt if it has ended.
struct Status {
    std::string name;
    pid_t parent = 0;
};
std::optional<Status> statusOf(const KernelPlaces& places, pid_t pid) {
    const std::string text = contentOf(fmt::format("{}/{}/stat", places.processes, pid));
    // "PID (NAME) STATE PARENT ..."; the name may hold blanks and parentheses.
    const std::size_t open = text.find('(');
    const std::size_t close = text.rfind(')');
    if (open == std::string::npos || close == std::string::npos || close < open || close + 4 > text.size()) {
        return std::nullopt;
    }
    Status status{text.substr(open + 1, close - open - 1), 0};
    const char* const end = text.data() + text.size();
    const auto [rest, failure] = std::from_chars(text.data() + close + 4, end, status.parent);
    return failure == std::errc() ? std::optional(status) : std::nullopt;
}

bool descendsFrom(const KernelPlaces& places, pid_t pid, pid_t ancestor) {
    for (int depth = 0; depth < deepest && pid > 1; ++depth) {
        if (pid == ancestor) {
            return true;
        }
        const auto status = statusOf(places, pid);
        if (!status) {
            return true;  // it has just ended
        }
        pid = status->parent;
    }
    return false;
}

}  // namespace

std::string controlGroupOf(pid_t pid, const KernelPlaces& places) {
    std::istringstream lines(contentOf(fmt::format("{}/{}/cgroup", places.processes, pid)));
    std::string found;
    for (std::string line; std::getline(lines, line);) {
        for (const std::string_view hierarchy : {"0::", "1:name=systemd:"}) {
            if (line.starts_with(hierarchy) && (found.empty() || found == "/")) {
                found = line.substr(hierarchy.size());
            }
        }
    }
    return found;
}

UnitProcesses unitProcesses(pid_t self, const std::string& mainProcess, const KernelPlaces& places) {
    const std::string group = controlGroupOf(self, places);
    const std::string unit = group.substr(group.rfind('/') + 1);
    if (!unit.ends_with(".service") || mainProcess != std::to_string(self)) {
        return {};
    }
    UnitProcesses found{unit, {}};
    std::istringstream members(membersOf(places, group));
    for (pid_t pid = 0; members >> pid;) {
        if (!descendsFrom(places, pid, self)) {
            if (const auto status = statusOf(places, pid)) {
                found.strays.push_back({pid, status->name});
            }
        }
    }
    return found;
}

}  // namespace adminhost
