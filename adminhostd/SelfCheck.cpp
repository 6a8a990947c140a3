#include "adminhostd/SelfCheck.h"

#include "adminhostd/Frame.h"
#include "adminhostd/FrontRights.h"
#include "adminhostd/ListeningSocket.h"
#include "adminhostd/PluginSelection.h"
#include "adminhostd/RunDirectory.h"
#include "adminhostd/ToolConfiguration.h"
#include "adminhostd/WorkerConfiguration.h"
#include "adminhostd/WorkerStart.h"
#include "platform/value/Result.h"

#include <cerrno>
#include <csignal>
#include <cstring>
#include <filesystem>
#include <iostream>
#include <string>
#include <vector>

#include <fmt/format.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/time.h>
#include <sys/wait.h>
#include <tl/expected.hpp>
#include <unistd.h>

namespace adminhost {
namespace {

/// The worker's first message, or why there is none.
tl::expected<protocol::Hello, std::string> helloOf(const protocol::Configure& configuration) {
    protocol::Hello hello;
    auto worker = startWorker(true);
    if (!worker) {
        return tl::unexpected<std::string>(
            fmt::format("The worker cannot be started: {}", worker.error().description.value_or("")));
    }
    const int socket = worker->conversation.get();
    const timeval bound{30, 0};
    ::setsockopt(socket, SOL_SOCKET, SO_RCVTIMEO, &bound, sizeof bound);
    bool ready = writeFrame(socket, protocol::frameOf(configuration));
    FrameReader reader;
    for (bool said = false; ready && !said;) {
        auto frame = readFrame(socket, reader);
        auto message = frame ? protocol::toFront(std::move(*frame)) : failure(Error{});
        ready = message.has_value();
        if (auto* here = message ? std::get_if<protocol::Hello>(&*message) : nullptr) {
            hello = std::move(*here);
            said = true;
        }
    }
    // It ends by itself, but one that hangs does not.
    worker->conversation.close();
    pollfd entry{worker->process.get(), POLLIN, 0};
    const bool hangs = ::poll(&entry, 1, 1000) == 0;
    if (hangs) {
        ::kill(worker->pid, SIGKILL);
    }
    int status = 0;
    while (::waitpid(worker->pid, &status, 0) < 0 && errno == EINTR) {
    }
    worker->tools.killRemaining();
    if (!ready) {
        return tl::unexpected<std::string>(hangs
                                               ? "The worker is not ready in time: a plug-in hangs while it is loaded."
                                               : "The worker " + endingText(status) + " before it was ready.");
    }
    return hello;
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
        static_cast<void>(frontAccount(options));
    } catch (const std::exception& error) {
        problems.emplace_back(error.what());
    }
    try {
        const PluginSelection plugins = selectPlugins(options);
        // Beside the socket, where the next start of the daemon removes what a killed check has left.
        const std::string parent = privateParent(options);
        const bool writable = ::access(parent.c_str(), W_OK | X_OK) == 0;
        const ToolConfiguration tools(writable ? parent : std::filesystem::temp_directory_path().string());
        protocol::Configure configuration = workerConfiguration(options, plugins, tools.directory());
        configuration.tryOnly = true;
        protocol::Hello hello;
        if (auto received = helloOf(configuration)) {
            hello = *std::move(received);
        } else {
            problems.push_back(received.error());
            hello.refused = configuration.refused;
        }
        for (const protocol::RefusedPlugin& plugin : hello.refused) {
            problems.push_back(plugin.reason);
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
