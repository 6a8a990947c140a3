#include "handler/DictionaryText.h"
#include "handler/LumioRequestHandler.h"
#include "platform/crypto/Crypt.h"
#include "platform/files/FileSystem.h"
#include "platform/framework/Report.h"
#include "platform/log/Log.h"
#include "platform/plist/PropertyList.h"
#include "platform/service/ServiceState.h"
#include "platform/task/Task.h"
#include "platform/value/ValueText.h"
#include "resources/Camera.h"
#include "resources/CountStatement.h"

#include <charconv>
#include <cmath>
#include <string>
#include <vector>

namespace lumio {

using adminhost::Dictionary;
using adminhost::HostPath;
using adminhost::Response;
using adminhost::Value;

namespace {

constexpr std::string_view notConfigured = "kNotConfigured";
constexpr std::string_view stopped = "STOPPED";
constexpr std::string_view running = "RUNNING";
constexpr std::string_view withDetails = "withDetails";
constexpr std::int32_t sharedFileSystemIsUnavailable = 69;  ///< a startup status

/// A whole number's low 32 bits, for every number; a text that is a decimal number counts by its value, anything else
/// is 0.
std::int32_t startupStatusOf(const Value& value) {
    constexpr double range = 9.2e18;  // of 64 bits
    std::int64_t number = 0;
    if (const auto boolean = value.boolean()) {
        number = *boolean ? 1 : 0;
    } else if (value.isInteger()) {
        number = value.integer() ? *value.integer() : static_cast<std::int64_t>(value.unsignedInteger().value_or(0));
    } else if (const auto real = value.real()) {
        number = std::abs(*real) < range ? static_cast<std::int64_t>(*real) : 0;
    } else if (const std::string* text = value.string()) {
        const auto [end, status] = std::from_chars(text->data(), text->data() + text->size(), number);
        if (status != std::errc() || end != text->data() + text->size()) {
            number = 0;
        }
    }
    return static_cast<std::int32_t>(static_cast<std::uint32_t>(number));
}

/// Runs "lumioctl server VERB" and returns its status.
std::int32_t control(std::string_view verb) {
    static const HostPath tool("/usr/sbin/lumioctl");
    adminhost::logEvent("adminhost_lumio: running lumioctl server " + std::string(verb));
    std::string error;
    const std::int32_t status =
        adminhost::launch_task(adminhost::diskPath(tool), {"server", std::string(verb)}, nullptr, &error);
    adminhost::logEvent("adminhost_lumio: " + std::string(verb) + " result: " + std::to_string(status));
    return status;
}

CountStatement runningJobs() {
    return {"select count(*) from jobs where nimbo_job_status=\"Running\";",
            "adminhost_lumio: error getting running jobs count: "};
}

CountStatement totalJobs() {
    return {"select count(*) from jobs where nimbo_job_id is not NULL",
            "adminhost_lumio: error getting total jobs count: "};
}

template <class Number>
void setIfKnown(Dictionary& answer, std::string_view key, std::optional<Number> value) {
    if (value) {
        answer.set(key, *std::move(value));
    }
}

}  // namespace

Response LumioRequestHandler::getStateWithRequest(const Dictionary& request) {
    const bool isRunning =
        adminhost::GetLaunchDaemonServiceState(HostPath("/System/Library/LaunchDaemons/com.brenn.lumioserverd.plist"));
    std::int32_t status = 0;
    if (isRunning) {
        const auto file = adminhost::readPropertyList(
            adminhost::diskPath(HostPath("/var/lumio/server/.lumioserverd_startup_status.plist")));
        if (file && file->dictionary() != nullptr) {
            status = startupStatusOf(file->dictionary()->get("error"));
        }
    }
    Dictionary answer{{"state", !isRunning    ? stopped
                                : status == 0 ? running
                                              : "RUNNING_WITH_ISSUE"},
                      {"readWriteSettingsVersion", 1},
                      {"setStateVersion", 1}};
    if (status != 0) {
        answer.set("migrationStatus", status);
    }
    if (request.get("variant") != Value(withDetails)) {
        return answer;
    }

    answer.set("serviceHasBeenConfigured", checkSetupDone());
    const auto startTime = getStartTime();
    // Not sharedFilesystemPath(): its default must not be shown as if it had been set.
    const auto path = textIn(identityPreferences().value_or(Dictionary()), "shared_filesystem");
    const Dictionary cluster = clusterPreferences().value_or(Dictionary());
    const auto controller = textIn(cluster, "nimbo_controller");
    const auto username = textIn(cluster, "nimbo_client_username");
    std::optional<std::string> password = nimboClientPasswordFromPrefs(cluster);
    std::string none;
    const adminhost::ScopedCleanse<std::string> wiped(password ? *password : none);
    const auto freeSpace = getFreeSpaceOfSharedFileSystem(path);

    if (isRunning) {
        setIfKnown(answer, "startTime", startTime);
    }
    setIfKnown(answer, "sharedFileSystemFreeSpace", freeSpace);
    setIfKnown(answer, "sharedFileSystemPath", path);
    setIfKnown(answer, "nimboControllerHostname", controller);
    answer.set("sharedFileSystemState", status == sharedFileSystemIsUnavailable
                                            ? "kSharedFileSystemUnavailable"
                                            : getStateOfSharedFileSystemPath(path, username));
    answer.set("nimboControllerState", getStateOfNimboController(controller, username, password));
    if (dbPathExists()) {
        std::vector<CountStatement> counts = Camera::counts();
        counts.push_back(runningJobs());
        counts.push_back(totalJobs());
        const std::vector<std::uint64_t> numbers = rowCounts(counts);
        auto number = numbers.begin();
        for (const char* key : {"totalCameras", "onlineCameras", "capturingCameras", "currentJobs", "totalJobs"}) {
            answer.set(key, *number++);
        }
    }
    return answer;
}

std::string_view LumioRequestHandler::getStateOfNimboController(const std::optional<std::string>& controller,
                                                                const std::optional<std::string>& username,
                                                                const std::optional<std::string>& password) {
    if (!controller || !username || !password) {
        return notConfigured;
    }
    std::string ignored;
    return checkNimboController(*controller, *username, *password, &ignored) == 0 ? "kNimboAvailable"
                                                                                  : "kNimboUnavailable";
}

std::string_view LumioRequestHandler::getStateOfSharedFileSystemPath(const std::optional<std::string>& path,
                                                                     const std::optional<std::string>& owner) {
    if (!path) {
        return notConfigured;
    }
    return validateSharedFilesystem(*path, owner) == 0 ? "kSharedFileSystemAvailable" : "kSharedFileSystemUnavailable";
}

std::optional<std::uint64_t> LumioRequestHandler::getFreeSpaceOfSharedFileSystem(
    const std::optional<std::string>& path) {
    return path ? adminhost::freeSpaceOf(adminhost::diskPath(HostPath(*path))) : std::nullopt;
}

std::optional<adminhost::Date> LumioRequestHandler::getStartTime() {
    return adminhost::creationDateOf(adminhost::diskPath(HostPath("/var/run/lumioserverd.pid")));
}

std::uint64_t LumioRequestHandler::getTotalJobs() {
    return rowCounts({totalJobs()}).front();
}

std::uint64_t LumioRequestHandler::getRunningJobs() {
    return rowCounts({runningJobs()}).front();
}

Response LumioRequestHandler::getLogPathsWithRequest(const Dictionary&) {
    return Dictionary{{"startup_log", "/Library/Logs/lumioserverd/startup.log"},
                      {"application_log", "/Library/Logs/lumioserverd/application.log"},
                      {"server_log", "/Library/Logs/lumioserverd/lumioserverd_out.log"},
                      {"server_error_log", "/Library/Logs/lumioserverd/lumioserverd_error.log"},
                      {"apache_access_log", "/Library/Logs/lumioserverd/apache_access.log"},
                      {"apache_error_log", "/Library/Logs/lumioserverd/apache_error.log"}};
}

Response LumioRequestHandler::startServiceWithVariant(const Value&) {
    if (control("start") != 0) {
        return responseForError("CANNOT_START_SERVICE_ERR");
    }
    adminhost::reportChange({"service", "", "lumioserverd", "state", nullptr, running, false, nullptr});
    markSetupDone();
    return nullptr;
}

Response LumioRequestHandler::stopServiceWithVariant(const Value& variant) {
    if (control("stop") != 0) {
        return responseForError("CANNOT_STOP_SERVICE_ERR");
    }
    adminhost::reportChange({"service", "", "lumioserverd", "state", nullptr, stopped, false, nullptr});
    Dictionary request;
    request.set("variant", variant);
    Response response = getStateWithRequest(request);
    // The service manager may still see the service running at this moment.
    response.dictionary().set("state", stopped);
    return response;
}

}  // namespace lumio
