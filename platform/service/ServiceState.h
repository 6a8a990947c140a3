#pragma once

// Whether a service's daemon is running, as the service manager knows it.
//
// A service is named by the path of its job file: "/System/Library/LaunchDaemons/com.example.serverd.plist" is the unit
// "com.example.serverd.service". The file itself is not read and need not exist. systemd is asked on the system bus,
// never through a tool. Where no systemd runs, the daemon's pid file is read instead.

#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"

#include <cstdint>
#include <string>

namespace adminhost {

enum class ServiceManager : std::uint8_t {
    systemd,
    /// The process whose id is in /var/run/NAME.pid below the system root; NAME is the last dotted part of the unit's
    /// name ("serverd"). It must have been started before the file was written: a process id may be used again.
    pidFile,
};

/// Sets the manager to ask. Until then it is defaultServiceManager(). The worker calls it before requests are served.
ADMINHOST_EXPORT void setServiceManager(ServiceManager manager) noexcept;
/// The pid file below a system root other than "/", and where systemd is not the machine's service manager; else
/// systemd.
[[nodiscard]] ADMINHOST_EXPORT ServiceManager defaultServiceManager() noexcept;
/// The manager that is asked now.
[[nodiscard]] ADMINHOST_EXPORT ServiceManager serviceManager() noexcept;

/// The base name of the job file without its extension, and ".service".
[[nodiscard]] ADMINHOST_EXPORT std::string unitOf(const HostPath& jobFile);

/// Returns true while the service is running: active, reloading or deactivating. A unit that is not known is not
/// running. Fails, with the reason, if the manager cannot be asked or does not reply within two seconds in all.
[[nodiscard]] ADMINHOST_EXPORT Result<bool> serviceIsRunning(const HostPath& jobFile);

/// The same; any failure counts as not running.
[[nodiscard]] ADMINHOST_EXPORT bool GetLaunchDaemonServiceState(const HostPath& jobFile);

}  // namespace adminhost
