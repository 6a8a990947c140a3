#include "adminhostd/LoadedPlugins.h"

#include "adminhostd/PluginCall.h"
#include "adminhostd/SettingsHistory.h"
#include "adminhostd/ToolConfiguration.h"
#include "platform/files/FilePlace.h"
#include "platform/files/ReplaceFile.h"
#include "platform/log/Log.h"
#include "platform/task/Task.h"
#include "platform/value/ValueText.h"

#include <algorithm>
#include <set>
#include <utility>

#include <fmt/format.h>
#include <unistd.h>

namespace adminhost {
namespace {

/// Follows no link that another account may have created: it could lead to that account's choice of file.
void removeLeftover(const HostPath& file) {
    FilePlace place;
    if (openPlace(diskPath(file), place) == 0) {
        static_cast<void>(::unlinkat(place.directory.get(), place.name.c_str(), 0));
    }
}

void logNamingFailure(const LoadedPlugin& loaded, const Error& error) {
    logEvent(fmt::format("adminhostd: the plug-in {} failed to name what interrupted operations left: {}", loaded.name,
                         textOf(error.description)));
}

}  // namespace

Result<LoadedPlugin> LoadedPlugins::load(const DiskPath& file, const std::vector<std::string>& languages) {
    const auto failed = [&](std::string_view what, const Error& error) {
        return failure(
            Error{error.domain, error.code, fmt::format("{}{}: {}", file.text(), what, textOf(error.description))});
    };
    auto loaded = loadPlugin(file);
    if (!loaded) {
        return loaded;
    }
    if (named(loaded->name) != nullptr) {
        return failure(Error{
            "plugin", 0, fmt::format("{}: a plug-in of the name \"{}\" is already loaded", file.text(), loaded->name)});
    }
    const auto configured = callPlugin([&] { loaded->plugin->configure(languages); });
    if (!configured) {
        return failed(" failed while it was configured", configured.error());
    }
    const auto files = callPlugin([&] { return loaded->plugin->toolFiles(); });
    const auto written = files
                             ? writeToolFiles(_toolEnvironment[toolConfigurationVariable] + "/" + loaded->name, *files)
                             : Result<void>(failure(files.error()));
    if (!written) {
        return failed(": the files of its tools cannot be written", written.error());
    }
    _plugins.push_back(*loaded);
    return loaded;
}

const LoadedPlugin* LoadedPlugins::named(std::string_view name) const {
    const auto found =
        std::find_if(_plugins.begin(), _plugins.end(), [&](const LoadedPlugin& plugin) { return plugin.name == name; });
    return found == _plugins.end() ? nullptr : &*found;
}

const Command* commandNamed(const LoadedPlugin& loaded, std::string_view name) {
    const auto found = std::find_if(loaded.commands.begin(), loaded.commands.end(),
                                    [&](const Command& command) { return command.name == name; });
    return found == loaded.commands.end() ? nullptr : &*found;
}

void LoadedPlugins::enter(const LoadedPlugin& loaded) const {
    auto variables = _toolEnvironment;
    variables[toolConfigurationVariable] += "/" + loaded.name;
    setToolFileVariables(std::move(variables));
}

Probe LoadedPlugins::ask(const LoadedPlugin& loaded, const std::string& need, std::chrono::milliseconds bound) const {
    enter(loaded);
    setTaskDeadline(std::chrono::steady_clock::now() + std::min<std::chrono::milliseconds>(bound, probeBound));
    auto probe = callPlugin([&] { return loaded.plugin->probe(need); });
    return probe ? *std::move(probe)
                 : Probe{Probe::State::unknown, "the plug-in failed: " + textOf(probe.error().description),
                         "see the daemon's log"};
}

std::optional<UnmetNeed> LoadedPlugins::unmetNeed(const LoadedPlugin& loaded, const std::string& command,
                                                  std::chrono::milliseconds bound) const {
    const Command* found = commandNamed(loaded, command);
    if (found == nullptr) {
        return std::nullopt;
    }
    for (const std::string& need : found->needs) {
        const Probe probe = ask(loaded, need, bound);
        if (probe.state != Probe::State::usable) {
            const std::string why = fmt::format("{}; {}", probe.reason, probe.fix);
            logEvent(fmt::format("adminhostd: {}/{} needs \"{}\": {}", loaded.name, command, need, why));
            return UnmetNeed{probe.state, fmt::format("The command needs \"{}\": {}.", need, why)};
        }
    }
    return std::nullopt;
}

std::vector<std::string> LoadedPlugins::needsThatAreNotUsable() const {
    std::vector<std::string> problems;
    for (const LoadedPlugin& loaded : _plugins) {
        std::set<std::string> needs;
        for (const Command& command : loaded.commands) {
            needs.insert(command.needs.begin(), command.needs.end());
        }
        for (const std::string& need : needs) {
            if (const Probe probe = ask(loaded, need, probeBound); probe.state != Probe::State::usable) {
                problems.push_back(fmt::format("{}: commands that need \"{}\" are refused: {}; {}", loaded.name, need,
                                               probe.reason, probe.fix));
            }
        }
    }
    return problems;
}

void LoadedPlugins::removeLeftovers() const {
    for (const LoadedPlugin& loaded : _plugins) {
        if (const auto files = callPlugin([&] { return loaded.plugin->leftovers(); })) {
            for (const HostPath& file : *files) {
                removeLeftover(file);
            }
        } else {
            logNamingFailure(loaded, files.error());
        }
        SettingsHistory(loaded.name, {}).removeUnfinished();
    }
}

void LoadedPlugins::removeSettingsLeftovers() const {
    for (const LoadedPlugin& loaded : _plugins) {
        if (const auto files = callPlugin([&] { return loaded.plugin->settingsFiles(); })) {
            for (const HostPath& file : *files) {
                adminhost::removeLeftovers(file);
            }
        } else {
            logNamingFailure(loaded, files.error());
        }
    }
}

}  // namespace adminhost
