// The plug-in's entry point: the one place that names all of it.

#include "platform/framework/Plugin.h"

#include "commands/CommandTable.h"
#include "handler/LumioRequestHandler.h"
#include "platform/log/Log.h"
#include "settings/Revision.h"

#include <algorithm>
#include <exception>
#include <iterator>
#include <string>

namespace {

using adminhost::Dictionary;
using adminhost::Response;
using lumio::LumioRequestHandler;

struct Operation {
    std::string_view command;
    Response (*perform)(LumioRequestHandler& handler, const Dictionary& request);
};

constexpr Operation operations[] = {
    {"readSettings", [](LumioRequestHandler& h, const Dictionary& r) { return h.readSettingsWithRequest(r); }},
    {"writeSettings", [](LumioRequestHandler& h, const Dictionary& r) { return h.writeSettingsWithRequest(r); }},
    {"getState", [](LumioRequestHandler& h, const Dictionary& r) { return h.getStateWithRequest(r); }},
    {"getLogPaths", [](LumioRequestHandler& h, const Dictionary& r) { return h.getLogPathsWithRequest(r); }},
    {"startService",
     [](LumioRequestHandler& h, const Dictionary& r) { return h.startServiceWithVariant(r.get("variant")); }},
    {"stopService",
     [](LumioRequestHandler& h, const Dictionary& r) { return h.stopServiceWithVariant(r.get("variant")); }},
    {"recycleService",
     [](LumioRequestHandler& h, const Dictionary& r) { return h.recycleServiceWithVariant(r.get("variant")); }},
    {"validateSettings", [](LumioRequestHandler& h, const Dictionary& r) { return h.validateSettingsWithRequest(r); }},
    {"createNimboAccount",
     [](LumioRequestHandler& h, const Dictionary& r) { return h.createNimboAccountWithRequest(r); }},
    {"getWorkflows", [](LumioRequestHandler& h, const Dictionary& r) { return h.getWorkflowsWithRequest(r); }},
    {"getCameras", [](LumioRequestHandler& h, const Dictionary& r) { return h.getCamerasWithRequest(r); }},
    {"getProperties", [](LumioRequestHandler& h, const Dictionary& r) { return h.getPropertiesWithRequest(r); }},
};

LumioRequestHandler& handler() {
    static LumioRequestHandler theHandler;
    return theHandler;
}

Response perform(std::string_view command, const Dictionary& request) noexcept {
    const auto* operation = std::find_if(std::begin(operations), std::end(operations),
                                         [&](const Operation& row) { return row.command == command; });
    try {
        if (operation == std::end(operations)) {
            return Response::error("UNKNOWN_COMMAND", "The plug-in does not serve this command.");
        }
        return operation->perform(handler(), request);
    } catch (const std::exception& exception) {
        adminhost::logEvent("adminhost_lumio: " + std::string(command) + " failed: " + exception.what());
    } catch (...) {
        adminhost::logEvent("adminhost_lumio: " + std::string(command) + " failed");
    }
    return handler().responseForError("INTERNAL_ERROR");
}

std::string revision() noexcept {
    try {
        return lumio::settingsRevision();
    } catch (const std::exception& exception) {
        adminhost::logEvent(std::string("adminhost_lumio: no revision: ") + exception.what());
        return {};
    }
}

std::vector<adminhost::HostPath> settingsFiles() noexcept {
    return {LumioRequestHandler::identityPreferencesPath(), LumioRequestHandler::clusterPreferencesPath(),
            LumioRequestHandler::memberPreferencesPath()};
}

constexpr adminhost::Plugin plugin{
    .name = "lumio",
    .version = ADMINHOST_RELEASE,
    .describe = []() noexcept { return lumio::describeCommands(); },
    .check = lumio::checkRequest,
    .revision = revision,
    .perform = perform,
    .settingsFiles = settingsFiles,
};

}  // namespace

ADMINHOST_PLUGIN(plugin)
