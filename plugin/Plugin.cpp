// The plug-in as the daemon's worker sees it: the one place that names all of it.

#include "platform/framework/Plugin.h"

#include "commands/CommandTable.h"
#include "handler/LumioRequestHandler.h"
#include "platform/files/Path.h"
#include "platform/framework/Report.h"
#include "platform/release/Release.h"
#include "plugin/InstallationChecks.h"
#include "resources/FormerProperties.h"
#include "settings/DatabaseTool.h"
#include "settings/Revision.h"

#include <algorithm>
#include <chrono>
#include <iterator>
#include <optional>
#include <string>
#include <utility>
#include <vector>

namespace {

using adminhost::Dictionary;
using adminhost::Response;
using lumio::LumioRequestHandler;

struct TableRow {
    std::string_view command;
    Response (*perform)(LumioRequestHandler& handler, const Dictionary& request);
};

constexpr std::string_view passwordKey = "nimbo_client_password";

// Indices in settingsFiles().
constexpr std::size_t identityFile = 0;
constexpr std::size_t clusterFile = 1;
constexpr std::size_t memberFile = 2;

constexpr TableRow operations[] = {
    {"readSettings", [](LumioRequestHandler& h, const Dictionary& r) { return h.readSettingsWithRequest(r); }},
    {"writeSettings",
     [](LumioRequestHandler& h, const Dictionary& r) {
         const Dictionary* configuration = r.get("configuration").dictionary();
         const lumio::FormerProperties former(configuration == nullptr ? nullptr
                                                                       : configuration->get("properties").array());
         return h.writeSettingsWithRequest(r);
     }},
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
    {"getAccess", [](LumioRequestHandler& h, const Dictionary& r) { return h.getAccessWithRequest(r); }},
    {"removeAccess", [](LumioRequestHandler& h, const Dictionary& r) { return h.removeAccessWithRequest(r); }},
    {"getProperties", [](LumioRequestHandler& h, const Dictionary& r) { return h.getPropertiesWithRequest(r); }},
};

const TableRow* operationNamed(std::string_view command) noexcept {
    const auto* found = std::find_if(std::begin(operations), std::end(operations),
                                     [&](const TableRow& row) { return row.command == command; });
    return found == std::end(operations) ? nullptr : found;
}

bool isOnlyRead(std::string_view keyPath) {
    constexpr std::string_view configuration = "configuration.";
    const auto keys = LumioRequestHandler::keysThatAreOnlyRead();
    return keyPath.starts_with(configuration) &&
           std::find(keys.begin(), keys.end(), keyPath.substr(configuration.size())) != keys.end();
}

/// The file that reading takes: an entry of the name on the shared file system, readable or not; else the cached copy.
adminhost::Result<std::optional<Dictionary>> storedOrCached(const adminhost::HostPath& path,
                                                            const adminhost::HostPath& cached) {
    return LumioRequestHandler::stored(adminhost::exists(adminhost::diskPath(path)) ? path : cached);
}

class LumioPlugin final : public adminhost::Plugin {
  public:
    std::string_view name() override { return "lumio"; }
    std::string_view version() override { return ADMINHOST_RELEASE; }

    std::vector<adminhost::Command> commands() override {
        std::vector<adminhost::Command> all;
        const adminhost::Value described = lumio::describeCommands();
        for (const lumio::CommandDescription& row : lumio::commands()) {
            adminhost::Command command;
            command.name = row.name;
            command.access = row.access;
            command.showsRevision = row.showsRevision;
            command.takesRevision = row.takesRevision;
            command.needs.assign(row.needs.begin(), row.needs.end());
            command.deadline = std::chrono::seconds(row.deadlineSeconds);
            command.served = operationNamed(row.name) != nullptr;
            command.description = *(*described.array())[all.size()].dictionary();
            all.push_back(std::move(command));
        }
        return all;
    }

    void configure(const std::vector<std::string>& languages) override {
        adminhost::setUserDefault("BrennLanguages", adminhost::Array(languages.begin(), languages.end()));
    }

    std::vector<adminhost::Finding> check(std::string_view command, const Dictionary& request) override {
        return lumio::checkRequest(command, request);
    }

    Response perform(std::string_view command, const Dictionary& request) override {
        for (const std::string& keyPath : lumio::unknownKeys(command, request)) {
            adminhost::reportNotDone(
                {keyPath,
                 isOnlyRead(keyPath) ? "ignored: the key can only be read" : "ignored: the key is not known",
                 {}});
        }
        const TableRow* operation = operationNamed(command);
        return operation == nullptr ? Response::error("UNKNOWN_COMMAND", "The plug-in does not serve this command.")
                                    : operation->perform(_handler, request);
    }

    /// Commands name no other need than "database".
    adminhost::Probe probe(std::string_view) override { return _databaseTool.probe(); }

    std::string revision() override { return lumio::settingsRevision(); }

    std::vector<adminhost::Setting> settingKeys() override {
        std::vector<adminhost::Setting> settings;
        for (const auto& [keys, file] : {std::pair(LumioRequestHandler::identityPreferencesKeysToCopy(), identityFile),
                                         std::pair(LumioRequestHandler::memberPreferencesKeysToCopy(), memberFile),
                                         std::pair(LumioRequestHandler::clusterPreferencesKeysToCopy(), clusterFile)}) {
            for (const std::string_view key : keys) {
                settings.push_back({std::string(key), false, file});
            }
        }
        settings.push_back({std::string(passwordKey), true, clusterFile});
        return settings;
    }

    /// Reading shows a file that it cannot read as one without settings. In the history that would look like an edit
    /// that removed them all, so this fails instead.
    adminhost::Result<Dictionary> settings() override {
        const auto identity = LumioRequestHandler::storedIdentity();
        if (!identity) {
            return adminhost::failure(identity.error());
        }
        const auto member = storedOrCached(LumioRequestHandler::memberPreferencesPath(*identity),
                                           LumioRequestHandler::cachedMemberPreferencesPath());
        if (!member) {
            return adminhost::failure(member.error());
        }
        const auto cluster = storedOrCached(LumioRequestHandler::clusterPreferencesPath(*identity),
                                            LumioRequestHandler::cachedClusterPreferencesPath());
        if (!cluster) {
            return adminhost::failure(cluster.error());
        }
        Dictionary values;
        for (const auto& [keys, file] : {std::pair(LumioRequestHandler::identityPreferencesKeysToCopy(), &*identity),
                                         std::pair(LumioRequestHandler::memberPreferencesKeysToCopy(), &*member),
                                         std::pair(LumioRequestHandler::clusterPreferencesKeysToCopy(), &*cluster)}) {
            if (*file) {
                LumioRequestHandler::copyKeys(keys, **file, values);
            }
        }
        if (*cluster) {
            LumioRequestHandler::copyKeys({passwordKey}, **cluster, values);  // protected, as it is stored
        }
        return values;
    }

    /// In the order of identityFile, clusterFile and memberFile.
    std::vector<adminhost::HostPath> settingsFiles() override {
        return {LumioRequestHandler::identityPreferencesPath(), LumioRequestHandler::clusterPreferencesPath(),
                LumioRequestHandler::memberPreferencesPath()};
    }

    std::vector<adminhost::Diagnosis> diagnose() override { return lumio::installationChecks(); }

    std::vector<adminhost::LogFile> logs() override {
        std::vector<adminhost::LogFile> logs;
        const Response paths = _handler.getLogPathsWithRequest({});
        for (const adminhost::DictionaryEntry& entry : paths.dictionary()) {
            logs.push_back({entry.key, adminhost::HostPath(*entry.value.string())});
        }
        return logs;
    }

    std::vector<adminhost::HostPath> leftovers() override { return {LumioRequestHandler::credentialCachePath()}; }

    std::vector<adminhost::ToolFile> toolFiles() override { return {lumio::databaseToolStartFile()}; }

  private:
    LumioRequestHandler _handler;
    lumio::DatabaseTool _databaseTool;
};

}  // namespace

ADMINHOST_PLUGIN(LumioPlugin)
