#include "adminhostd/ConfigurationEntry.h"
#include "adminhostd/DirectoryConfiguration.h"
#include "adminhostd/Options.h"
#include "adminhostd/PermissionConfiguration.h"
#include "platform/files/File.h"

#include <cmath>
#include <sstream>
#include <stdexcept>
#include <system_error>

#include <fmt/format.h>
#include <toml++/toml.h>

namespace adminhost {
namespace {

constexpr std::size_t configurationMaximum = std::size_t{1} << 20U;  ///< bytes

constexpr std::string_view knownKeys[] = {"plugins",
                                          "plugin_directory",
                                          "socket",
                                          "socket_group",
                                          "account",
                                          "languages",
                                          "account_uuids",
                                          "service_manager",
                                          "request_deadline_seconds",
                                          "client_timeout_seconds",
                                          "queue_limit",
                                          "queue_limit_per_account",
                                          "body_limit_bytes",
                                          "values_limit",
                                          "depth_limit",
                                          "head_limit_bytes",
                                          "connection_limit",
                                          "log",
                                          "directory",
                                          "permission"};

/// Applies a key that bounds requests. Returns false for any other key.
bool applyBound(const ConfigurationEntry& entry, RequestBounds& bounds) {
    constexpr std::int64_t kibibyte = 1024;
    const auto number = [&](std::int64_t least, std::int64_t most) {
        return static_cast<std::size_t>(entry.wholeNumber(least, most));
    };
    if (entry.key() == "body_limit_bytes") {
        bounds.bodyBytes = number(kibibyte, 64 * kibibyte * kibibyte);
    } else if (entry.key() == "values_limit") {
        bounds.body.values = number(100, 10'000'000);
    } else if (entry.key() == "depth_limit") {
        bounds.body.depth = number(1, 512);
    } else if (entry.key() == "head_limit_bytes") {
        bounds.headBytes = number(kibibyte, kibibyte * kibibyte);
    } else if (entry.key() == "connection_limit") {
        bounds.connections = number(2, 4096);
    } else if (entry.key() == "client_timeout_seconds") {
        bounds.clientTimeout = std::chrono::seconds(std::llround(std::ceil(entry.seconds())));
    } else {
        return false;
    }
    return true;
}

void apply(const ConfigurationEntry& entry, Options& options) {
    constexpr std::int64_t longestQueue = 10'000;
    if (entry.key() == "plugins") {
        options.plugins.clear();
        for (const std::string& file : entry.texts()) {
            options.plugins.push_back(diskPath(HostPath(file)));
        }
    } else if (entry.key() == "plugin_directory") {
        options.pluginDirectory = HostPath(entry.text());
    } else if (entry.key() == "socket") {
        options.socket = diskPath(HostPath(entry.text()));
    } else if (entry.key() == "socket_group") {
        options.socketGroup = entry.text();
    } else if (entry.key() == "account") {
        options.account = entry.name();
    } else if (entry.key() == "languages") {
        const std::vector<std::string> texts = entry.texts();
        options.languages = Array(texts.begin(), texts.end());
    } else if (entry.key() == "account_uuids") {
        options.accountUuids = entry.text();
    } else if (entry.key() == "service_manager") {
        options.serviceManager =
            entry.choice<ServiceManager>({{"systemd", ServiceManager::systemd}, {"pidfile", ServiceManager::pidFile}});
    } else if (entry.key() == "request_deadline_seconds") {
        options.deadline = std::chrono::milliseconds(std::llround(std::ceil(entry.seconds() * 1000)));
    } else if (entry.key() == "queue_limit") {
        options.queueLimit = static_cast<std::size_t>(entry.wholeNumber(0, longestQueue));
    } else if (entry.key() == "queue_limit_per_account") {
        options.queueLimitPerAccount = static_cast<std::size_t>(entry.wholeNumber(1, longestQueue));
    } else if (entry.key() == "log") {
        options.logToStandardError = entry.choice<bool>({{"syslog", false}, {"stderr", true}});
    } else if (entry.key() == "directory") {
        readDirectory(entry, options.directory);
    } else if (entry.key() == "permission") {
        readPermissions(entry, options.permissions);
    } else if (!applyBound(entry, options.bounds)) {
        entry.rejectAsUnknown(knownKeys);
    }
}

}  // namespace

std::string configurationTextIn(const std::string& file) {
    // The parser would read a directory, or a file whose reading fails, as an empty file.
    auto text = readFile(DiskPath(file), configurationMaximum);
    if (!text) {
        throw std::runtime_error(fmt::format("{}: {}; the configuration must be a readable file", file,
                                             std::generic_category().message(static_cast<int>(text.error().code))));
    }
    return *std::move(text);
}

void applyConfiguration(const std::string& file, const std::string& text, Options& options) {
    toml::table table;
    try {
        table = toml::parse(text, file);
    } catch (const toml::parse_error& error) {
        throw std::runtime_error(fmt::format("{}: {}", placeText(file, error.source().begin), error.description()));
    }
    for (const auto& [key, node] : table) {
        apply({file, {}, key, node}, options);
    }
    options.configurationText = text;
}

void readConfiguration(const std::string& file, Options& options) {
    applyConfiguration(file, configurationTextIn(file), options);
}

}  // namespace adminhost
