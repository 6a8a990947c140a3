#include "handler/LumioRequestHandler.h"
#include "handler/SettingsReports.h"
#include "platform/crypto/Crypt.h"
#include "platform/files/CreateMissing.h"
#include "platform/files/ReplaceFile.h"
#include "platform/log/Log.h"
#include "platform/plist/PropertyList.h"
#include "platform/task/Task.h"
#include "platform/value/ValueText.h"
#include "resources/Property.h"

#include <algorithm>
#include <array>
#include <initializer_list>
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
/// Domain of the framework's own errors, whose underlying error has the details.
constexpr std::string_view generalErrorDomain = "adminhost";

struct ScriptRun {
    std::int32_t status;
    std::string words;  ///< its error text
};

ScriptRun runSetupScript(std::string_view name) {
    const HostPath script(std::string("/usr/share/sorvaneproducer/lumioserverd/script/").append(name));
    ScriptRun run{};
    run.status = adminhost::launch_task_with_input(adminhost::diskPath(script), {}, std::nullopt, nullptr, &run.words);
    run.words.erase(run.words.find_last_not_of(" \t\r\n") + 1);
    return run;
}

constexpr std::string_view preferencesScript = "setup_lumioserverd_preferences";
constexpr std::string_view libraryScript = "setup_lumioserverd_library";
constexpr std::string_view resolveKey = "nimbo_controller_resolve_name";
constexpr std::array<std::string_view, 3> resourceKeys = {"workflows", "cameras", "properties"};
/// The keys of the cluster file, with the one that is never read.
SettingKeys clusterKeys() {
    SettingKeys keys = LumioRequestHandler::clusterPreferencesKeysToCopy();
    keys.push_back(passwordKey);
    return keys;
}

/// Reports the settings that were not written because a step failed.
void reportSkipped(std::initializer_list<SettingKeys> files, const Dictionary& config, const std::string& reason,
                   const std::string& words) {
    bool any = false;
    for (const SettingKeys& keys : files) {
        reportSettingsNotDone(keys, config, reason, words);
        any = any || std::any_of(keys.begin(), keys.end(), [&](std::string_view key) { return config.contains(key); });
    }
    if (!any) {
        reportSettingNotDone({}, reason, words);
    }
}

/// Why a value could not be protected: the system's error text for the key file.
std::string keyFileWords() {
    const HostPath file(SettingsStore::sharedFilesystemPath() + "/Server/Secrets/kek.plist");
    const auto keys = SettingsStore::stored(file);
    return !keys   ? keys.error().description.value_or("")
           : *keys ? file.text() + " does not hold a usable key"
                   : file.text() + " does not exist";
}

/// Keeps a copy of a file that exists but cannot be loaded, because it is going to be replaced and an administrator may
/// want to look at it.
void keepBeside(const HostPath& path) {
    const auto kept = adminhost::keepUnreadable(path);
    adminhost::logEvent("adminhost_lumio: " + path.text() + " cannot be loaded" +
                        (kept ? "; it is kept as " + kept->text() : " or kept: " + textOf(kept.error())));
}

/// The dictionary that a write begins with: the stored preferences, else the cached copy, else empty.
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
    if (auto written = adminhost::writePropertyList(prefs, path); !written) {
        return SettingsWriteError{"", 400, std::move(written.error())};
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

/// Returns true if the configuration has a value for the key that is not the stored one.
bool changes(const Dictionary& config, std::string_view key, const Dictionary& stored) {
    return config.contains(key) && config.get(key) != stored.get(key);
}

/// The name under which the controller is to be resolved; nullopt if the value is used unchanged.
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

    if (config.contains(resolveKey) && !config.contains(controllerKey)) {
        reportSettingNotDone(resolveKey, "ignored: it has an effect only together with nimbo_controller");
    }
    const std::int32_t status = writeSettingsFiles(config, result);

    // Resources are changed whether or not the settings files were written.
    setWorkflowACLWithRequest(config.get("workflows").array());
    processCameraChangesWithRequest(config.get("cameras").array());
    processPropertyChangesWithRequest(config.get("properties").array());
    for (const std::string_view key : resourceKeys) {
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

std::int32_t LumioRequestHandler::writeSettingsFiles(Dictionary& config, Dictionary& result) {
    const SettingKeys identity = identityPreferencesKeysToCopy();
    const SettingKeys member = memberPreferencesKeysToCopy();
    // The identity preferences come first: the library script and the later files already see a new shared file system.
    if (const ScriptRun run = runSetupScript(preferencesScript); run.status != 0) {
        reportSkipped({identity, clusterKeys(), member}, config,
                      "not written: the preferences setup script failed with status " + std::to_string(run.status),
                      run.words);
        return run.status;
    }
    if (const std::int32_t status = setIdentityPreferencesFromConfig(config, result); status != 0) {
        reportSettingsNotDone(clusterKeys(), config, "not written: the identity preferences cannot be written",
                              textOf(result.get("errorDescription")));
        reportSettingsNotDone(member, config, "not written: the identity preferences cannot be written",
                              textOf(result.get("errorDescription")));
        return status;
    }
    if (const ScriptRun run = runSetupScript(libraryScript); run.status != 0) {
        reportSkipped({clusterKeys(), member}, config,
                      "not written: the library setup script failed with status " + std::to_string(run.status),
                      run.words);
        return run.status;
    }
    if (const std::int32_t status = setClusterPreferencesFromConfig(config, result); status != 0) {
        reportSettingsNotDone(member, config, "not written: the cluster preferences cannot be written",
                              textOf(result.get("errorDescription")));
        return status;
    }
    if (const std::int32_t status = setMemberPreferencesFromConfig(config, result); status != 0) {
        return status;
    }
    markSetupDone();
    return 0;
}

namespace {

struct FileWrite {
    std::int32_t status = 0;
    bool isInPlace = false;  ///< also true if only the flush of the directory has failed
};

/// Writes the file of one set operation and reports the outcome for its keys.
FileWrite writeAndReport(const SettingKeys& keys, const Dictionary& config, const Dictionary& before,
                         const Dictionary& after, const HostPath& path, Dictionary& result) {
    const auto error = writeSettingsFile(after, path);
    const std::int32_t status = statusOf(error, result);
    const bool isInPlace = !error || error->underlying.domain == adminhost::notFlushed;
    if (isInPlace) {
        reportSettingChanges(keys, before, after);
    } else {
        reportSettingsNotDone(keys, config, "not written: the file cannot be written",
                              textOf(result.get("errorDescription")));
    }
    if (isInPlace && error) {
        reportSettingNotDone({}, "written, but the settings file might be lost in a power cut",
                             textOf(result.get("errorDescription")));
    }
    return {status, isInPlace};
}

/// The status if the identity preferences cannot be read. The place of the other files is not known then, so no file is
/// written, least of all below the default shared file system.
std::int32_t unknownPlace(const SettingKeys& keys, const Dictionary& config, const Error& error, Dictionary& result) {
    reportSettingsNotDone(keys, config,
                          "not written: the identity preferences, which name the place of the file, cannot be read",
                          error.description.value_or(""));
    return statusOf(SettingsWriteError{"", 400, error}, result);
}

}  // namespace

std::int32_t LumioRequestHandler::setIdentityPreferencesFromConfig(Dictionary& config, Dictionary& result) {
    auto stored = storedIdentity();
    if (!stored) {
        keepBeside(identityPreferencesPath());
    }
    const Dictionary before = stored && *stored ? **std::move(stored) : Dictionary();
    Dictionary prefs = before;
    if (changes(config, "shared_filesystem", prefs)) {
        result.set("needsRecycleOrRestart", true);
    }
    copyKeys(identityPreferencesKeysToCopy(), config, prefs);
    return writeAndReport(identityPreferencesKeysToCopy(), config, before, prefs, identityPreferencesPath(), result)
        .status;
}

std::int32_t LumioRequestHandler::setMemberPreferencesFromConfig(Dictionary& config, Dictionary& result) {
    const auto identity = storedIdentity();
    if (!identity) {
        return unknownPlace(memberPreferencesKeysToCopy(), config, identity.error(), result);
    }
    const HostPath path = memberPreferencesPath(*identity);
    const Dictionary before = startAt(path, cachedMemberPreferencesPath());
    Dictionary prefs = before;
    copyKeys(memberPreferencesKeysToCopy(), config, prefs);
    return writeAndReport(memberPreferencesKeysToCopy(), config, before, prefs, path, result).status;
}

std::int32_t LumioRequestHandler::setClusterPreferencesFromConfig(Dictionary& config, Dictionary& result) {
    const auto identity = storedIdentity();
    if (!identity) {
        return unknownPlace(clusterKeys(), config, identity.error(), result);
    }
    const HostPath path = clusterPreferencesPath(*identity);
    const Dictionary before = startAt(path, cachedClusterPreferencesPath());
    Dictionary prefs = before;
    if (changes(config, "nimbo_client_username", prefs)) {
        result.set("needsRecycleOrRestart", true);
    }
    const bool passwordGiven = config.contains(passwordKey);
    bool passwordProtected = true;
    if (passwordGiven) {
        std::string password = textOf(config.get(passwordKey));
        const adminhost::ScopedCleanse<std::string> wiped(password);
        config.remove(passwordKey);
        if (password.empty()) {
            prefs.remove(passwordKey);
        } else if (nimboClientPasswordFromPrefs(prefs) != password) {
            if (auto encrypted = Property::encryptValue(password)) {
                prefs.set(passwordKey, *std::move(encrypted));
            } else {
                passwordProtected = false;
                adminhost::logEvent("adminhost_lumio: nimbo_client_password encryption failed");
                reportSettingNotDone(passwordKey, "not written: the password cannot be encrypted", keyFileWords());
            }
        }
    }
    copyKeys(clusterPreferencesKeysToCopy(), config, prefs);
    std::string unresolved;
    if (const auto name = nameToResolve(config)) {
        if (auto host = hostNameOfController(*name)) {
            prefs.set(controllerKey, *std::move(host));
        } else {
            unresolved = host.error().description.value_or("not found");
        }
    }
    const FileWrite write = writeAndReport(clusterPreferencesKeysToCopy(), config, before, prefs, path, result);
    if (write.isInPlace) {
        reportSecretChange(passwordKey, before, prefs);
        if (!unresolved.empty()) {
            reportSettingNotDone(controllerKey, "stored as given: the name cannot be resolved", unresolved);
        }
    } else if (passwordGiven && passwordProtected) {
        reportSettingNotDone(passwordKey, "not written: the file cannot be written",
                             textOf(result.get("errorDescription")));
    }
    return write.status;
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
    return runSetupScript(preferencesScript).status;
}

std::int32_t LumioRequestHandler::setupLibrary() const {
    return runSetupScript(libraryScript).status;
}

void LumioRequestHandler::markSetupDone() {
    if (checkSetupDone()) {
        return;
    }
    const HostPath directory{std::string(stateDirectory)};
    const adminhost::OwnerAndMode attributes{0, adminhost::groupIdOf("wheel").value_or(0), 0755};
    if (const auto created = adminhost::createDirectories(adminhost::diskPath(directory), attributes); !created) {
        adminhost::logEvent("adminhost_lumio: failed to create directory at path: " + directory.text() +
                            ", error: " + textOf(created.error()));
    }
    const HostPath marker{std::string(setupDoneMarker)};
    if (const auto created = adminhost::createEmptyFile(adminhost::diskPath(marker)); !created) {
        adminhost::logEvent("adminhost_lumio: failed to create file at path: " + marker.text());
        reportSettingNotDone({}, "not created: the file that marks the service as configured, " + marker.text(),
                             created.error().description.value_or(""));
    }
}

bool LumioRequestHandler::checkSetupDone() const {
    return adminhost::exists(adminhost::diskPath(HostPath{std::string(setupDoneMarker)}));
}

}  // namespace lumio
