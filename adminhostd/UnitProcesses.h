#pragma once

// Processes that run in the daemon's own unit of the service manager, although the daemon has not kept them.
//
// A control tool should ask the service manager to start its service. One that starts the service itself leaves it in
// the unit of the daemon, which called the tool: the manager counts its memory and tasks as the daemon's, applies the
// unit's restrictions to it, and may end it together with the daemon.

#include <string>
#include <vector>

#include <sys/types.h>

namespace adminhost {

struct UnitProcess {
    pid_t pid = 0;
    std::string name;  ///< as the kernel shows it
};

struct UnitProcesses {
    std::string unit;  ///< "adminhostd.service"; empty if the process is not the main process of a unit
    std::vector<UnitProcess> strays;
};

/// Where the kernel shows processes and control groups.
struct KernelPlaces {
    std::string processes = "/proc";
    std::string groups = "/sys/fs/cgroup";
};

/// The path of the process's control group in the one hierarchy of version 2, or in the manager's own of version 1;
/// empty if it cannot be read.
[[nodiscard]] std::string controlGroupOf(pid_t pid, const KernelPlaces& places = {});

/// The processes of the unit whose main process is this one, without it and its descendants. `mainProcess` is the
/// manager's word for the unit's main process (the environment's SYSTEMD_EXEC_PID); empty: none.
[[nodiscard]] UnitProcesses unitProcesses(pid_t self, const std::string& mainProcess, const KernelPlaces& places = {});

}  // namespace adminhost
