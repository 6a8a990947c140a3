#include "adminhostd/SelfCheck.h"

#include "adminhostd/ListeningSocket.h"
#include "adminhostd/PluginSelection.h"
#include "adminhostd/RunDirectory.h"
#include "adminhostd/ToolConfiguration.h"
#include "adminhostd/WorkerConfiguration.h"
#include "adminhostd/WorkerProcess.h"

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <iostream>
#include <string>
#include <vector>

#include <fmt/format.h>
#include <unistd.h>

namespace adminhost {
namespace {

/// The worker's first message. If there is none, `problem` describes why.
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
        // Beside the socket, where the next start of the daemon removes what a killed check has left.
        const std::string parent = privateParent(options);
        const bool writable = ::access(parent.c_str(), W_OK | X_OK) == 0;
        const ToolConfiguration tools(writable ? parent : std::filesystem::temp_directory_path().string());
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
        problems.insert(problems.end(), hello.problems.begin(), hello.problems.end());
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
