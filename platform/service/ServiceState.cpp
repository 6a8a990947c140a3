#include "platform/service/ServiceState.h"

#include "platform/service/Managers.h"

#include <optional>

#include <systemd/sd-daemon.h>

namespace adminhost {
namespace {

std::optional<ServiceManager> chosen;

}  // namespace

void setServiceManager(ServiceManager manager) noexcept {
    chosen = manager;
}

ServiceManager defaultServiceManager() noexcept {
    return systemRoot() == "/" && ::sd_booted() > 0 ? ServiceManager::systemd : ServiceManager::pidFile;
}

ServiceManager serviceManager() noexcept {
    return chosen.value_or(defaultServiceManager());
}

std::string unitOf(const HostPath& jobFile) {
    const std::string& path = jobFile.text();
    const std::string name = path.substr(path.rfind('/') + 1);  // all of it if there is no slash
    return name.substr(0, name.rfind('.')) + ".service";
}

Result<bool> serviceIsRunning(const HostPath& jobFile) {
    const std::string unit = unitOf(jobFile);
    return serviceManager() == ServiceManager::systemd ? unitIsRunning(unit) : pidFileNamesRunningProcess(unit);
}

bool GetLaunchDaemonServiceState(const HostPath& jobFile) {
    return serviceIsRunning(jobFile).value_or(false);
}

}  // namespace adminhost
