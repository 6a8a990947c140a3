#include "adminhostd/Options.h"

#include "adminhostd/PluginFile.h"
#include "platform/release/Release.h"

#include <cstdlib>
#include <filesystem>
#include <iostream>
#include <stdexcept>

#include <CLI/CLI.hpp>

namespace adminhost {
namespace {

constexpr const char* defaultConfiguration = "/etc/adminhostd.toml";

std::string absolute(const std::string& path) {
    return path.empty() ? path : std::filesystem::absolute(path).string();
}

/// The configuration file that the command line names or, if it names none, the one that is always read if it exists.
ConfigurationText configurationOnDisk(const std::string& named) {
    const DiskPath standard = diskPath(HostPath(defaultConfiguration));
    if (named.empty() && !exists(standard)) {
        return {};
    }
    // It names the files that are loaded into the daemon, so the same rules apply to it as to plug-ins.
    if (const auto problem = named.empty() ? distrust(standard) : distrustNamed(DiskPath(named))) {
        throw std::runtime_error(*problem);
    }
    const std::string file = named.empty() ? standard.text() : named;
    return {absolute(file), configurationTextIn(file)};
}

/// Without a configuration that is given, reads its file. Throws std::runtime_error for a mistake in it.
std::optional<Options> read(int count, const char* const* arguments, int& status, const ConfigurationText* given) {
    Options options;
    options.arguments.assign(arguments, arguments + count);
    std::vector<std::string> plugins;
    std::string socket;
    std::string configuration;
    std::string log;

    CLI::App app("Server administration daemon: serves the operations of its plug-ins over a Unix socket.",
                 "adminhostd");
    app.add_option("--root", options.root, "Directory below which all fixed paths are")->type_name("DIR");
    app.add_option("--plugin", plugins, "Plug-in to load, instead of those of the plug-in directory")
        ->type_name("FILE")
        ->allow_extra_args(false);
    app.add_option("--socket", socket, "Socket to listen at; not below the root")->type_name("PATH");
    app.add_option("--config", configuration, "Configuration file (/etc/adminhostd.toml below the root)")
        ->type_name("FILE");
    app.add_option("--log", log, "Where the log goes: syslog or stderr")->check(CLI::IsMember({"syslog", "stderr"}));
    app.add_flag("--check", options.check, "Check configuration, plug-ins and paths, report what is wrong, and exit");
    app.set_version_flag("--version", std::string("adminhostd ") + ADMINHOST_RELEASE);
    try {
        app.parse(count, arguments);
    } catch (const CLI::ParseError& error) {
        status = app.exit(error, std::cout, std::cerr) == 0 ? 0 : 2;
        return std::nullopt;
    }
    // The worker leaves the directory in which the daemon was started, and tools are named by absolute paths.
    options.root = absolute(options.root);
    setSystemRoot(options.root);
    options.root = systemRoot();
    // Missing directories below it are created, but a typo is not a new root. A front gets a configuration, cannot
    // always enter the root, and leaves this check to the monitor.
    if (given == nullptr && !std::filesystem::is_directory(options.root)) {
        throw std::runtime_error(options.root + " is not a directory; create it or correct --root");
    }
    options.configurationIsNamed = !configuration.empty();
    const ConfigurationText source = given != nullptr ? *given : configurationOnDisk(configuration);
    options.configuration = source.path;
    if (!source.path.empty()) {
        applyConfiguration(options.configurationIsNamed ? configuration : source.path, source.text, options);
    }
    if (!plugins.empty()) {
        options.plugins.clear();
        for (const std::string& file : plugins) {
            options.plugins.emplace_back(file);
        }
    }
    for (DiskPath& file : options.plugins) {
        file = DiskPath(absolute(file.text()));
    }
    if (!socket.empty()) {
        options.socket = DiskPath(socket);
    }
    if (!log.empty()) {
        options.logToStandardError = log == "stderr";
    }
    return options;
}

Options readAll(const std::vector<std::string>& arguments, const ConfigurationText* given) {
    std::vector<const char*> texts;
    texts.reserve(arguments.size());
    for (const std::string& argument : arguments) {
        texts.push_back(argument.c_str());
    }
    int status = 0;
    auto options = read(static_cast<int>(texts.size()), texts.data(), status, given);
    if (!options) {
        throw std::runtime_error("the command line cannot be understood");
    }
    return *std::move(options);
}

}  // namespace

std::optional<Options> readOptions(int count, const char* const* arguments, int& status) {
    try {
        return read(count, arguments, status, nullptr);
    } catch (const std::runtime_error& error) {
        std::cerr << "adminhostd: " << error.what() << '\n';
        status = 1;
        return std::nullopt;
    }
}

Options readOptionsAgain(const std::vector<std::string>& arguments) {
    return readAll(arguments, nullptr);
}

Options readOptionsWith(const std::vector<std::string>& arguments, const ConfigurationText& configuration) {
    return readAll(arguments, &configuration);
}

std::vector<std::string> keepFixedSettings(Options& read, const Options& old) {
    std::vector<std::string> keys;
    const auto keep = [&](const char* key, auto& now, const auto& before) {
        if (now != before) {
            keys.emplace_back(key);
            now = before;
        }
    };
    keep("socket", read.socket, old.socket);
    keep("socket_group", read.socketGroup, old.socketGroup);
    keep("account", read.account, old.account);
    keep("log", read.logToStandardError, old.logToStandardError);
    keep("client_timeout_seconds", read.bounds.clientTimeout, old.bounds.clientTimeout);
    keep("head_limit_bytes", read.bounds.headBytes, old.bounds.headBytes);
    keep("connection_limit", read.bounds.connections, old.bounds.connections);
    return keys;
}

std::string configurationFile(const Options& options) {
    return options.configuration.empty() ? diskPath(HostPath(defaultConfiguration)).text() : options.configuration;
}

}  // namespace adminhost
