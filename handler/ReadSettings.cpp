#include "handler/LumioRequestHandler.h"
#include "platform/crypto/Crypt.h"
#include "platform/framework/Report.h"
#include "platform/value/ValueText.h"
#include "resources/Property.h"

#include <algorithm>
#include <cmath>
#include <cstdlib>
#include <limits>
#include <string>

namespace lumio {

using adminhost::Dictionary;
using adminhost::Response;
using adminhost::Value;

namespace {

constexpr std::int64_t portMinimum = std::numeric_limits<std::int32_t>::min();
constexpr std::int64_t portMaximum = std::numeric_limits<std::int32_t>::max();

/// The numeric reading of a port: a text as strtoll reads it, a real without its fraction, clamped to 32 bits.
std::int32_t portOf(const Value& value) {
    std::int64_t number = 0;
    if (const std::string* text = value.string()) {
        number = std::strtoll(text->c_str(), nullptr, 10);
    } else if (const auto real = value.real()) {
        const double whole = std::isnan(*real) ? 0 : std::trunc(*real);
        number = static_cast<std::int64_t>(
            std::clamp(whole, static_cast<double>(portMinimum), static_cast<double>(portMaximum)));
    } else if (const auto boolean = value.boolean()) {
        number = *boolean ? 1 : 0;
    } else if (value.isInteger()) {
        number = value.integer().value_or(portMaximum);
    }
    return static_cast<std::int32_t>(std::clamp(number, portMinimum, portMaximum));
}

/// The catalog service listens on the port after the web application's; past the last port it wraps.
std::int32_t portAfter(std::int32_t port) noexcept {
    return static_cast<std::int32_t>(static_cast<std::uint32_t>(port) + 1U);
}

/// Moves a listing's list into the configuration; a listing that failed has no list and adds nothing.
void moveList(Response response, std::string_view key, Dictionary& config) {
    if (Value* list = response.dictionary().find(key)) {
        config.set(key, std::move(*list));
    }
}

}  // namespace

Response LumioRequestHandler::readSettingsWithRequest(const Dictionary& request) {
    const std::int32_t status = setupPreferences();
    adminhost::announceReading();  // the script may have changed the settings
    const Value& variantValue = request.at("optionalArguments.variant");
    const bool all = variantValue.isNull();
    const auto variantIs = [&](std::string_view name) { return variantValue == Value(name); };

    Dictionary config{{"default_shared_filesystem", defaultSharedFilesystem}};
    if (all || variantIs("getConfig")) {
        copyIdentityPreferencesToConfig(config);
        copyClusterPreferencesToConfig(config);
        copyMemberPreferencesToConfig(config);
        copyLibraryInformationToConfig(config);
    }
    // The tool would create a missing database file, so it must not run before the file is known to exist.
    if (dbPathExists()) {
        if (all || variantIs("getCameras")) {
            moveList(getCamerasWithRequest(request), "cameras", config);
        }
        if (all || variantIs("getWorkflows")) {
            moveList(getWorkflowsWithRequest(request), "workflows", config);
        }
        if (all || variantIs("getProperties") || variantIs("getConfig")) {
            moveList(getPropertiesWithRequest(request), "properties", config);
        }
    }
    Dictionary answer{{"readStatus", status}};
    answer.set("configuration", std::move(config));
    return answer;
}

void LumioRequestHandler::copyIdentityPreferencesToConfig(Dictionary& config) const {
    if (const auto prefs = identityPreferences()) {
        copyKeys(identityPreferencesKeysToCopy(), *prefs, config);
    }
}

void LumioRequestHandler::copyClusterPreferencesToConfig(Dictionary& config) const {
    if (const auto prefs = clusterPreferences()) {
        copyKeys(clusterPreferencesKeysToCopy(), *prefs, config);
        std::string password = nimboClientPasswordFromPrefs(*prefs).value_or("");
        config.set("nimbo_client_password_is_set", !password.empty());
        adminhost::cleanse(password.data(), password.size());
    }
}

std::optional<std::string> LumioRequestHandler::nimboClientPasswordFromPrefs(const Dictionary& prefs) {
    return Property::decryptValue(prefs.get("nimbo_client_password"));
}

void LumioRequestHandler::copyMemberPreferencesToConfig(Dictionary& config) const {
    const auto prefs = memberPreferences();
    if (!prefs) {
        return;
    }
    copyKeys(memberPreferencesKeysToCopy(), *prefs, config);
    const Value* host = prefs->find("server_host");
    const Value* port = prefs->find("server_port");
    if (host != nullptr && port != nullptr) {
        config.set("web_app_url", "https://" + textOf(*host) + ":" + textOf(*port) + "/sorvaneproducer/capture");
        config.set("catalog_url", "http://" + textOf(*host) + ":" + std::to_string(portAfter(portOf(*port))) +
                                      "/sorvaneproducer/catalogs");
    }
}

void LumioRequestHandler::copyLibraryInformationToConfig(Dictionary& config) const {
    if (const auto information = libraryInformation()) {
        copyKeys(libraryInformationKeysToCopy(), *information, config);
    }
}

void LumioRequestHandler::copyKeys(const std::vector<std::string_view>& keys, const Dictionary& source,
                                   Dictionary& destination) {
    for (const std::string_view key : keys) {
        if (const Value* value = source.find(key)) {
            destination.set(key, *value);
        }
    }
}

std::vector<std::string_view> LumioRequestHandler::identityPreferencesKeysToCopy() {
    return {"member_uuid", "shared_filesystem"};
}

std::vector<std::string_view> LumioRequestHandler::libraryInformationKeysToCopy() {
    return {"library_version", "server_uuid"};
}

std::vector<std::string_view> LumioRequestHandler::keysThatAreOnlyRead() {
    std::vector<std::string_view> keys = libraryInformationKeysToCopy();
    keys.insert(keys.end(),
                {"default_shared_filesystem", "nimbo_client_password_is_set", "web_app_url", "catalog_url"});
    return keys;
}

std::vector<std::string_view> LumioRequestHandler::memberPreferencesKeysToCopy() {
    return {"server_host",
            "server_port",
            "sorvane_capture_web_enabled",
            "max_file_size_in_mb",
            "upload_chunk_size_in_mb",
            "ssl_certificate_file",
            "ssl_certificate_key_file",
            "tunnel_agent_host",
            "tunnel_agent_port",
            "tunnel_server_host",
            "tunnel_server_port",
            "tunnel_timeout_seconds"};
}

std::vector<std::string_view> LumioRequestHandler::clusterPreferencesKeysToCopy() {
    return {"agent_max_recording_minutes",
            "agent_unattended_recording_minutes",
            "http_auth_type",
            "camera_status_min_interval_seconds",
            "camera_watcher_check_interval_seconds",
            "camera_preview_cache_seconds",
            "agent_timeout_seconds",
            "nimbo_controller",
            "nimbo_job_cleanup_minutes",
            "submissions_groupname",
            "external_command_timeout_seconds",
            "nimbo_client_username",
            "nimbo_grid_id"};
}

}  // namespace lumio
