#include "adminhostd/Options.h"
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

/// One key of the file, with the place for messages.
struct Entry {
    const std::string& file;
    std::string_view key;
    const toml::node& node;

    [[noreturn]] void fail(std::string_view expected) const {
        throw std::runtime_error(
            fmt::format("{}, line {}: \"{}\" must be {}", file, node.source().begin.line, key, expected));
    }
    [[nodiscard]] std::string text() const {
        const auto value = node.value_exact<std::string>();
        return value ? *value : (fail("a text"), std::string());
    }
    [[nodiscard]] std::vector<std::string> texts() const {
        std::vector<std::string> list;
        const toml::array* array = node.as_array();
        if (array == nullptr) {
            fail("a list of texts");
        }
        for (const toml::node& element : *array) {
            const auto value = element.value_exact<std::string>();
            if (!value) {
                fail("a list of texts");
            }
            list.push_back(*value);
        }
        return list;
    }
    [[nodiscard]] double seconds() const {
        const auto value = node.is_number() ? node.value<double>() : std::nullopt;
        if (!value || !std::isfinite(*value) || *value <= 0 || *value > 86'400) {
            fail("a number of seconds, above 0 and at most 86400");
        }
        return *value;
    }
};

void apply(const Entry& entry, Options& options) {
    if (entry.key == "plugins") {
        options.plugins.clear();
        for (const std::string& file : entry.texts()) {
            options.plugins.push_back(diskPath(HostPath(file)));
        }
    } else if (entry.key == "plugin_directory") {
        options.pluginDirectory = HostPath(entry.text());
    } else if (entry.key == "socket") {
        options.socket = diskPath(HostPath(entry.text()));
    } else if (entry.key == "socket_group") {
        options.socketGroup = entry.text();
    } else if (entry.key == "languages") {
        const std::vector<std::string> texts = entry.texts();
        options.languages = Array(texts.begin(), texts.end());
    } else if (entry.key == "account_uuids") {
        options.accountUuids = entry.text();
    } else if (entry.key == "service_manager") {
        const std::string text = entry.text();
        if (text != "systemd" && text != "pidfile") {
            entry.fail("\"systemd\" or \"pidfile\"");
        }
        options.serviceManager = text;
    } else if (entry.key == "request_deadline_seconds") {
        options.deadline = std::chrono::milliseconds(std::llround(std::ceil(entry.seconds() * 1000)));
    } else if (entry.key == "client_timeout_seconds") {
        options.clientTimeout = std::chrono::seconds(std::llround(std::ceil(entry.seconds())));
    } else if (entry.key == "queue_limit") {
        const auto value = entry.node.value_exact<std::int64_t>();
        if (!value || *value < 0 || *value > 10'000) {
            entry.fail("a whole number from 0 to 10000");
        }
        options.queueLimit = static_cast<std::size_t>(*value);
    } else if (entry.key == "log") {
        const std::string text = entry.text();
        if (text != "syslog" && text != "stderr") {
            entry.fail("\"syslog\" or \"stderr\"");
        }
        options.logToStandardError = text == "stderr";
    } else {
        throw std::runtime_error(
            fmt::format("{}, line {}: unknown key \"{}\"; known keys: plugins, plugin_directory, socket, "
                        "socket_group, languages, account_uuids, service_manager, "
                        "request_deadline_seconds, client_timeout_seconds, queue_limit, log",
                        entry.file, entry.node.source().begin.line, entry.key));
    }
}

}  // namespace

void readConfiguration(const std::string& file, Options& options) {
    // The parser would read a directory, or a file whose reading fails, as an empty file.
    const auto text = readFile(DiskPath(file), configurationMaximum);
    if (!text) {
        throw std::runtime_error(fmt::format("{}: {}; the configuration must be a readable file", file,
                                             std::generic_category().message(static_cast<int>(text.error().code))));
    }
    toml::table table;
    try {
        table = toml::parse(*text, file);
    } catch (const toml::parse_error& error) {
        const auto place = error.source().begin;
        throw std::runtime_error(
            place ? fmt::format("{}, line {}, column {}: {}", file, place.line, place.column, error.description())
                  : fmt::format("{}: {}", file, error.description()));
    }
    for (const auto& [key, node] : table) {
        apply({file, key.str(), node}, options);
    }
}

}  // namespace adminhost
