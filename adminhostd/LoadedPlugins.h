#pragma once

// The plug-ins that the worker has loaded, and the questions it asks them besides their operations.

#include "adminhostd/PluginFile.h"
#include "platform/files/Path.h"
#include "platform/framework/Plugin.h"
#include "platform/value/Result.h"

#include <chrono>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

/// A need of a command that is not usable, or not known to be.
struct UnmetNeed {
    Probe::State state = Probe::State::unknown;
    std::string message;  ///< the need, the reason and the fix
};

class LoadedPlugins {
  public:
    static constexpr auto probeBound = std::chrono::seconds(5);  ///< for one question about a need

    /// Loads a file, configures the plug-in and writes the files of its tools. The error's description names the file
    /// and what is wrong.
    [[nodiscard]] Result<LoadedPlugin> load(const DiskPath& file, const std::vector<std::string>& languages);
    [[nodiscard]] const std::vector<LoadedPlugin>& all() const noexcept { return _plugins; }
    /// The loaded plug-in of that name; null if it is not found.
    [[nodiscard]] const LoadedPlugin* named(std::string_view name) const;

    /// The environment of the plug-ins' tools, apart from each plug-in's own directory.
    void setToolEnvironment(std::map<std::string, std::string> environment) {
        _toolEnvironment = std::move(environment);
    }
    /// Sets where the tools that the plug-in runs from now on find the files that it gives them.
    void enter(const LoadedPlugin& loaded) const;

    /// Asks whether the command's needs are usable, each within the bound and probeBound, and returns the first one
    /// that is not, which is also logged; nullopt if all are.
    [[nodiscard]] std::optional<UnmetNeed> unmetNeed(const LoadedPlugin& loaded, const std::string& command,
                                                     std::chrono::milliseconds bound) const;
    /// Asks every plug-in about all that its commands need, and returns a sentence for each need that is not usable.
    [[nodiscard]] std::vector<std::string> needsThatAreNotUsable() const;

    /// Removes files of workers that were killed in the middle of a write. Only for a worker that holds the lock for
    /// changes: another process may be writing a file that looks left over.
    void removeLeftovers() const;
    /// Removes what interrupted writes left beside the settings files, which may be on a file system that hangs.
    void removeSettingsLeftovers() const;

  private:
    [[nodiscard]] Probe ask(const LoadedPlugin& loaded, const std::string& need, std::chrono::milliseconds bound) const;

    std::map<std::string, std::string> _toolEnvironment;
    std::vector<LoadedPlugin> _plugins;
};

/// The plug-in's command of that name; null if it has none.
[[nodiscard]] const Command* commandNamed(const LoadedPlugin& loaded, std::string_view name);

}  // namespace adminhost
