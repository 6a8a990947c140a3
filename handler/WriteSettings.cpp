#include "handler/LumioRequestHandler.h"
#include "platform/crypto/Crypt.h"
#include "platform/files/Make.h"
#include "platform/files/ReplaceFile.h"
#include "platform/log/Log.h"
#include "platform/plist/PropertyList.h"
#include "platform/task/Task.h"
#include "platform/value/ValueText.h"
#include "resources/Property.h"

#include <string>

namespace lumio {

using adminhost::Dictionary;
using adminhost::Error;
using adminhost::HostPath;
using adminhost::Response;
using adminhost::Value;

namespace {

constexpr std::string_view setupDoneMarker = "/var/lumio/server/.lumio_setup_done";
constexpr std::string_view passwordKey = "nimbo_client_password";
constexpr std::string_view controllerKey = "nimbo_controller";
constexpr std::string_view localSuffix = ".local";
/// Domain of the errors that the framework itself makes up, whose underlying error tells the story.
constexpr std::string_view generalErrorDomain = "adminhost";

std::int32_t runSetupScript(std::string_view name) {
    const HostPath script(std::string("/usr/share/sorvaneproducer/lumioserverd/script/").append(name));
    return adminhost::launch_task_with_input(adminhost::diskPath(script), {}, std::nullopt, nullptr, nullptr);
}

/// Keeps a file that exists but cannot be loaded beside its place, because it is going to be replaced: what it holds
/// is the administrator's to look at.
void keepBeside(const HostPath& path) {
    Error error;
    const auto kept = adminhost::keepUnreadable(path, &error);
    adminhost::logEvent("adminhost_lumio: " + path.text() + " cannot be loaded" +
                        (kept ? "; it is kept as " + kept->text() : " or kept: " + textOf(error)));
}

/// What a write begins with: the stored preferences, else the cached copy, else none.
Dictionary startAt(const HostPath& path, const HostPath& cached) {
    auto stored = SettingsStore::stored(path);
    if (!stored) {
        keepBeside(path);
        return {};
    }
    if (!*stored) {
        stored = SettingsStore::stored(cached);
    }
    return stored && *stored ? **std::move(stored) : Dictionary();
}

std::optional<SettingsWriteError> writeSettingsFile(const Dictionary& prefs, const HostPath& path) {
    if (std::optional<Error> error = adminhost::writePropertyList(prefs, path)) {
        return SettingsWriteError{"", 400, *std::move(error)};
    }
    return std::nullopt;
}

/// The status of a write; a failure's text goes into the result.
std::int32_t statusOf(const std::optional<SettingsWriteError>& error, Dictionary& result) {
    if (!error) {
        return 0;
    }
    result.set("errorDescription", error->underlying.description.value_or(""));
    return static_cast<std::int32_t>(error->domain == generalErrorDomain ? error->underlying.code : error->code);
}

/// Whether the configuration holds a value for the key that is not the stored one.
bool changes(const Dictionary& config, std::string_view key, const Dictionary& stored) {
    return config.contains(key) && config.get(key) != stored.get(key);
}

/// The name under which the controller is to be resolved; nothing when it stands for itself.
std::optional<std::string> nameToResolve(const Dictionary& config) {
    const Value& value = config.get(controllerKey);
    if (value.isNull()) {
        return std::nullopt;
    }
    std::string name = textOf(value);
    if (!booleanOf(config.get("nimbo_controller_resolve_name"))) {
        if (name.ends_with(localSuffix)) {
            name.erase(name.size() - localSuffix.size());  // whatever other dots are left
        } else if (name.find('.') != std::string::npos) {
            return std::nullopt;
        }
    }
    return name.empty() ? std::nullopt : std::optional(std::move(name));
}

}  // namespace

Response LumioRequestHandler::writeSettingsWithRequest(const Dictionary& request) {
    Dictionary result;
    const Dictionary* given = request.get("configuration").dictionary();
    Dictionary config = given == nullptr ? Dictionary() : *given;

    // The identity preferences come first: the library script and the later files already see a new shared file system.
    std::int32_t status = setupPreferences();
    if (status == 0) {
        status = setIdentityPreferencesFromConfig(config, result);
    }
    if (status == 0) {
        status = setupLibrary();
    }
    if (status == 0) {
        status = setClusterPreferencesFromConfig(config, result);
    }
    if (status == 0) {
        status = setMemberPreferencesFromConfig(config, result);
    }
    if (status == 0) {
        markSetupDone();
    }

    // Resources are changed whatever became of the settings files.
    setWorkflowACLWithRequest(config.get("workflows").array());
    processCameraChangesWithRequest(config.get("cameras").array());
    processPropertyChangesWithRequest(config.get("properties").array());
    for (const std::string_view key : {"workflows", "cameras", "properties"}) {
        config.remove(key);
    }

    result.set("readStatus", 0);
    result.set("writeStatus", status);
    Response read = readSettingsWithRequest(request);
    if (Value* configuration = read.dictionary().find("configuration")) {
        result.set("configuration", std::move(*configuration));
    }
    return result;
}

std::int32_t LumioRequestHandler::setIdentityPreferencesFromConfig(Dictionary& config, Dictionary& result) {
    auto stored = storedIdentity();
    if (!stored) {
        keepBeside(identityPreferencesPath());
    }
    Dictionary prefs = stored && *stored ? **std::move(stored) : Dictionary();
    if (changes(config, "shared_filesystem", prefs)) {
        result.set("needsRecycleOrRestart", true);
    }
    copyKeys(identityPreferencesKeysToCopy(), config, prefs);
    return statusOf(writeIdentityPreferences(prefs), result);
}

std::int32_t LumioRequestHandler::setMemberPreferencesFromConfig(Dictionary& config, Dictionary& result) {
    // Identity preferences that cannot be read say nothing about where the file belongs: nothing is written then, least
    // of all below the default shared file system.
    const auto identity = storedIdentity();
    if (!identity) {
        return statusOf(SettingsWriteError{"", 400, identity.error()}, result);
    }
    const HostPath path = memberPreferencesPath(*identity);
    Dictionary prefs = startAt(path, cachedMemberPreferencesPath());
    copyKeys(memberPreferencesKeysToCopy(), config, prefs);
    return statusOf(writeSettingsFile(prefs, path), result);
}

std::int32_t LumioRequestHandler::setClusterPreferencesFromConfig(Dictionary& config, Dictionary& result) {
    const auto identity = storedIdentity();
    if (!identity) {
        return statusOf(SettingsWriteError{"", 400, identity.error()}, result);
    }
    const HostPath path = clusterPreferencesPath(*identity);
    Dictionary prefs = startAt(path, cachedClusterPreferencesPath());
    if (changes(config, "nimbo_client_username", prefs)) {
        result.set("needsRecycleOrRestart", true);
    }
    if (config.contains(passwordKey)) {
        std::string password = textOf(config.get(passwordKey));
        const adminhost::ScopedCleanse<std::string> wiped(password);
        config.remove(passwordKey);
        if (password.empty()) {
            prefs.remove(passwordKey);
        } else if (nimboClientPasswordFromPrefs(prefs) != password) {
            if (auto encrypted = Property::encryptValue(password)) {
                prefs.set(passwordKey, *std::move(encrypted));
            } else {
                adminhost::logEvent("adminhost_lumio: nimbo_client_password encryption failed");
            }
        }
    }
    copyKeys(clusterPreferencesKeysToCopy(), config, prefs);
    if (const auto name = nameToResolve(config)) {
        if (auto host = hostNameOfController(*name)) {
            prefs.set(controllerKey, *std::move(host));
        }
    }
    return statusOf(writeSettingsFile(prefs, path), result);
}

std::optional<SettingsWriteError> LumioRequestHandler::writeIdentityPreferences(const Dictionary& prefs) {
    return writeSettingsFile(prefs, identityPreferencesPath());
}

std::optional<SettingsWriteError> LumioRequestHandler::writeClusterPreferences(const Dictionary& prefs) {
    return writeSettingsFile(prefs, clusterPreferencesPath());
}

std::optional<SettingsWriteError> LumioRequestHandler::writeMemberPreferences(const Dictionary& prefs) {
    return writeSettingsFile(prefs, memberPreferencesPath());
}

std::int32_t LumioRequestHandler::setupPreferences() const {
    return runSetupScript("setup_lumioserverd_preferences");
}

std::int32_t LumioRequestHandler::setupLibrary() const {
    return runSetupScript("setup_lumioserverd_library");
}

void LumioRequestHandler::markSetupDone() {
    if (checkSetupDone()) {
        return;
    }
    const HostPath directory{std::string(stateDirectory)};
    const adminhost::DirectoryAttributes attributes{0, adminhost::groupIdOf("wheel").value_or(0), 0755};
    if (const auto error = adminhost::makeDirectories(adminhost::diskPath(directory), attributes)) {
        adminhost::logEvent("adminhost_lumio: failed to create directory at path: " + directory.text() +
                            ", error: " + textOf(*error));
    }
    const HostPath marker{std::string(setupDoneMarker)};
    if (adminhost::makeEmptyFile(adminhost::diskPath(marker))) {
        adminhost::logEvent("adminhost_lumio: failed to create file at path: " + marker.text());
    }
}

bool LumioRequestHandler::checkSetupDone() const {
    return adminhost::exists(adminhost::diskPath(HostPath{std::string(setupDoneMarker)}));
}

}  // namespace lumio
