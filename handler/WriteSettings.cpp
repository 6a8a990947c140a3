#include "handler/LumioRequestHandler.h"
#include "platform/task/Task.h"

#include <string>

namespace lumio {

namespace {

std::int32_t runSetupScript(std::string_view name) {
    const adminhost::HostPath script(std::string("/usr/share/sorvaneproducer/lumioserverd/script/").append(name));
    return adminhost::launch_task_with_input(adminhost::diskPath(script), {}, std::nullopt, nullptr, nullptr);
}

}  // namespace

std::int32_t LumioRequestHandler::setupPreferences() const {
    return runSetupScript("setup_lumioserverd_preferences");
}

}  // namespace lumio
