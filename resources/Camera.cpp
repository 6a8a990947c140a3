#include "resources/Camera.h"

#include "platform/log/Log.h"
#include "platform/task/Task.h"
#include "platform/value/ValueText.h"
#include "resources/ToolWords.h"
#include "settings/SettingsStore.h"

namespace lumio {

using adminhost::Dictionary;
using adminhost::Error;

namespace {

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

std::vector<CountStatement> Camera::counts() {
    return {{"select count(*) from cameras where (disabled != 't' OR disabled is NULL);",
             "Error getting total camera count: "},
            {"select count(*) from cameras where ((recording_status!=\"offline\") AND (disabled != 't' OR disabled is "
             "NULL));",
             "Error getting online camera count: "},
            {"select count(*) from cameras where ((recording_status like \"capturing%\" OR "
             "recording_status=\"paused\") AND (disabled != 't' OR disabled is NULL));",
             "Error getting running camera count: "}};
}

std::uint64_t Camera::getTotalCameraCount() {
    return rowCounts({counts().at(0)}).front();
}

std::uint64_t Camera::getOnlineCameraCount() {
    return rowCounts({counts().at(1)}).front();
}

std::uint64_t Camera::getRunningCameraCount() {
    return rowCounts({counts().at(2)}).front();
}

}  // namespace lumio
