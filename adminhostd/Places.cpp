#include "adminhostd/Places.h"

#include "adminhostd/ListeningSocket.h"
#include "adminhostd/PluginFile.h"
#include "adminhostd/ToolConfiguration.h"
#include "adminhostd/WorkerProcess.h"
#include "platform/framework/BuildNote.h"

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <iostream>
#include <stdexcept>

#include <fmt/format.h>
#include <grp.h>
#include <sys/stat.h>
#include <unistd.h>

namespace adminhost {
namespace {

protocol::RefusedPlugin refusedFile(const DiskPath& file, const std::string& reason) {
    return {file.text(), reason};
}

std::vector<std::string> textsOf(const Array& list) {
    std::vector<std::string> texts;
    for (const Value& value : list) {
        if (value.string() != nullptr) {
            texts.push_back(*value.string());
        }
    }
    return texts;
}

/// The worker's first message. Without one the problem says why.
protocol::Hello helloOf(const protocol::Configure& configuration, std::string& problem) {
    const auto worker = WorkerProcess::start(true);
    if (!worker || !worker->send(protocol::frameOf(configuration))) {
        problem = fmt::format("The worker cannot be started: {}", std::strerror(errno));
        return {};
    }
    for (int waited = 0; waited < 300; ++waited) {
        std::vector<pollfd> entries;
        worker->addTo(entries);
        ::poll(entries.data(), entries.size(), 100);
        static_cast<void>(worker->converse());
        while (auto frame = worker->next()) {
            auto message = protocol::toFront(std::move(*frame));
            if (auto* hello = message ? std::get_if<protocol::Hello>(&*message) : nullptr) {
                worker->finish(1000);
                return std::move(*hello);
            }
        }
        if (worker->ending()) {
            problem = "The worker " + *worker->ending() + " before it was ready.";
            return {};
        }
    }
    problem = "The worker is not ready in time: a plug-in hangs while it is loaded.";
    return {};
}

}  // namespace

PluginSelection selectPlugins(const Options& options) {
    PluginSelection selection;
    if (!options.plugins.empty()) {
        for (const DiskPath& file : options.plugins) {
            if (const auto reason = openToEverybody(file)) {
                selection.refused.push_back(refusedFile(file, *reason));
            } else {
                selection.files.push_back(file);
            }
        }
        return selection;
    }
    const DiskPath directory = diskPath(options.pluginDirectory);
    if (const auto reason = distrust(directory)) {
        selection.refused.push_back(refusedFile(directory, *reason));
        return selection;
    }
    const auto files = pluginsIn(directory);
    if (!files) {
        selection.refused.push_back(refusedFile(directory, directory.text() + ": " + std::strerror(errno)));
        return selection;
    }
    for (const DiskPath& file : *files) {
        if (const auto reason = distrust(file)) {
            selection.refused.push_back(refusedFile(file, *reason));
        } else {
            selection.files.push_back(file);
        }
    }
    return selection;
}

std::string socketPath(const Options& options) {
    if (options.socket) {
        return options.socket->text();
    }
    const std::string directory = diskPath(options.runDirectory).text();
    std::error_code ignored;
    // A failure shows when the socket is created.
    std::filesystem::create_directories(directory, ignored);
    return directory + "/adminhostd.sock";
}

gid_t groupOf(const std::string& name) {
    if (name.empty()) {
        return ListeningSocket::sameGroup;
    }
    const group* entry = ::getgrnam(name.c_str());
    if (entry == nullptr) {
        throw std::runtime_error(
            fmt::format("unknown group \"{}\"; create it or correct socket_group in the configuration", name));
    }
    return entry->gr_gid;
}

std::string privateParent(const Options& options) {
    return options.socket ? std::filesystem::temp_directory_path().string() : diskPath(options.runDirectory).text();
}

protocol::Configure workerConfiguration(const Options& options, const PluginSelection& plugins,
                                        const std::string& toolConfiguration) {
    protocol::Configure configuration;
    configuration.build = ADMINHOST_RELEASE ", " ADMINHOST_BUILD_IDENTITY;
    configuration.root = options.root;
    for (const DiskPath& file : plugins.files) {
        configuration.plugins.push_back(file.text());
    }
    configuration.languages = textsOf(options.languages ? *options.languages : languagesOfEnvironment());
    configuration.accountUuids = options.accountUuids;
    configuration.toolEnvironment = {{"XDG_CONFIG_HOME", toolConfiguration}};
    return configuration;
}

int check(const Options& options) {
    std::vector<std::string> problems;
    std::string loaded;
    const std::string socket = socketPath(options);
    const std::string directory = std::filesystem::path(socket).parent_path().string();
    if (::access(directory.empty() ? "." : directory.c_str(), W_OK | X_OK) != 0) {
        problems.push_back(fmt::format(
            "The socket {} cannot be created: {}; create its directory, or choose another path with --socket", socket,
            std::strerror(errno)));
    }
    if (const auto problem = socketPathProblem(socket)) {
        problems.push_back(*problem);
    }
    if (const DiskPath uuids = diskPath(HostPath(options.accountUuids));
        !options.accountUuids.empty() && ::access(uuids.c_str(), R_OK) != 0) {
        problems.push_back(fmt::format("Access lists cannot be read: {}: {}; create the file or correct account_uuids",
                                       uuids.text(), std::strerror(errno)));
    }
    try {
        static_cast<void>(groupOf(options.socketGroup));
    } catch (const std::exception& error) {
        problems.emplace_back(error.what());
    }
    try {
        const PluginSelection plugins = selectPlugins(options);
        const ToolConfiguration tools(std::filesystem::temp_directory_path().string());
        std::string problem;
        protocol::Configure configuration = workerConfiguration(options, plugins, tools.directory());
        configuration.tryOnly = true;
        const protocol::Hello hello = helloOf(configuration, problem);
        if (!problem.empty()) {
            problems.push_back(problem);
        }
        for (const auto& refused : {plugins.refused, hello.refused}) {
            for (const protocol::RefusedPlugin& plugin : refused) {
                problems.push_back(plugin.reason);
            }
        }
        if (hello.databaseTool) {
            problems.push_back("Commands that need the database will be refused: " + *hello.databaseTool);
        }
        for (const protocol::OfferedPlugin& plugin : hello.plugins) {
            loaded += fmt::format(" {} {}", plugin.name, plugin.version);
        }
        if (loaded.empty() && problems.empty()) {
            problems.push_back("No plug-in found in " + diskPath(options.pluginDirectory).text() +
                               "; install one, or name one with --plugin");
        }
    } catch (const std::exception& error) {
        problems.emplace_back(error.what());
    }
    for (const std::string& problem : problems) {
        std::cout << problem << '\n';
    }
    if (problems.empty()) {
        std::cout << "Nothing is wrong. Plug-ins:" << loaded << ". Socket: " << socket << '\n';
    }
    return problems.empty() ? 0 : 1;
}

}  // namespace adminhost
