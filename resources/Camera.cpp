#include "resources/Camera.h"

#include "platform/log/Log.h"
#include "platform/task/Task.h"
#include "platform/value/ValueText.h"
#include "resources/ToolWords.h"
#include "settings/SettingsStore.h"

#include <cstdlib>

namespace lumio {

using adminhost::Dictionary;
using adminhost::Error;

namespace {

std::uint64_t count(const std::string& statement, std::string_view what) {
    std::optional<Error> error;
    const auto rows = Camera::querySorvaneDatabase<Dictionary>(statement, error);
    if (error) {
        adminhost::logEvent(std::string("Error getting ").append(what) + " camera count: " + textOf(*error));
    }
    if (!rows || rows->empty()) {
        return 0;
    }
    const std::string* number = rows->back().get("count(*)").string();
    return number == nullptr ? 0 : static_cast<std::uint64_t>(std::strtoll(number->c_str(), nullptr, 10));
}

std::string joined(const std::vector<std::string>& words) {
    std::string text;
    for (const std::string& word : words) {
        text += (text.empty() ? "" : ",") + word;
    }
    return text;
}

}  // namespace

std::optional<std::vector<std::unique_ptr<Camera>>> Camera::allCamerasWithError(std::optional<Error>& error) {
    static const std::vector<std::string> columns{"id",
                                                  "name",
                                                  "uuid",
                                                  "create_user_uuid",
                                                  "created_at",
                                                  "update_user_uuid",
                                                  "updated_at",
                                                  "last_recording_uuid",
                                                  "use_user_uuid",
                                                  "used_at",
                                                  "recording_status",
                                                  "access_control_enabled"};
    if (!SettingsStore::dbPathExists()) {
        error = missingDatabase();
        return std::nullopt;
    }
    return orError(
        resourcesOf<Camera>("select " + joined(columns) + " from cameras where (disabled != 't' OR disabled is NULL)",
                            columns),
        error);
}

std::optional<Error> Camera::delete_() {
    static const adminhost::HostPath tool("/usr/bin/lumioconfig");
    const std::optional<std::string> uuid = statementGuid();
    if (!uuid) {
        reportNotDone("", "not removed: the entry has no \"_id_\"");
        return Error{"adminhost_lumio", -1, std::nullopt};
    }
    std::string output;
    std::string words;
    const std::int32_t status =
        adminhost::launch_task(adminhost::diskPath(tool), {"--remove_camera", *uuid}, &output, &words);
    if (status != 0) {
        reportNotDone("", "not removed: the configuration tool failed with status " + std::to_string(status),
                      toolWords(words, output));
        return Error{"adminhost_lumio", status, std::nullopt};
    }
    reportChange(*uuid, "", *uuid, nullptr, {});
    return std::nullopt;
}

std::uint64_t Camera::getTotalCameraCount() {
    return count("select count(*) from cameras where (disabled != 't' OR disabled is NULL);", "total");
}

std::uint64_t Camera::getOnlineCameraCount() {
    return count(
        "select count(*) from cameras where ((recording_status!=\"offline\") AND (disabled != 't' OR disabled is "
        "NULL));",
        "online");
}

std::uint64_t Camera::getRunningCameraCount() {
    return count(
        "select count(*) from cameras where ((recording_status like \"capturing%\" OR recording_status=\"paused\") AND "
        "(disabled != 't' OR disabled is NULL));",
        "running");
}

}  // namespace lumio
