#pragma once

// The daemon's options: its command line and its configuration file.

#include "adminhostd/ConfigurationCopy.h"
#include "adminhostd/DirectoryOptions.h"
#include "adminhostd/Permissions.h"
#include "adminhostd/RequestBounds.h"
#include "platform/files/Path.h"
#include "platform/service/ServiceState.h"
#include "platform/value/Value.h"

#include <chrono>
#include <optional>
#include <string>
#include <vector>

namespace adminhost {

struct Options {
    std::string root = "/";
    std::vector<DiskPath> plugins;  ///< instead of the plug-in directory's, if there are any
    HostPath pluginDirectory{"/usr/lib/adminhostd/plugins"};
    HostPath runDirectory{"/run/adminhostd"};
    std::optional<DiskPath> socket;  ///< instead of the one in the run directory
    std::string socketGroup;         ///< empty: the daemon's own
    std::string account;             ///< of the front, if started as the superuser; empty: see frontAccount()
    std::optional<Array> languages;  ///< instead of those of the environment
    std::string accountUuids;        ///< host path of the accounts' UUIDs; empty: name-based ones
    std::optional<ServiceManager> serviceManager;  ///< nullopt: the platform's default
    DirectoryOptions directory;
    std::chrono::milliseconds deadline{300'000};  ///< of one operation
    RequestBounds bounds;
    std::size_t queueLimit = 64;
    std::size_t queueLimitPerAccount = 16;  ///< for accounts other than root and the daemon's own
    std::vector<PermissionOptions> permissions;
    std::string configuration;          ///< path on disk of the file that was read; empty: none
    std::string configurationText;      ///< what the file contained
    bool configurationIsNamed = false;  ///< on the command line
    bool logToStandardError = false;
    bool check = false;
    std::vector<std::string> arguments;  ///< the command line, with the program's name
};

/// Reads both; the command line wins. Sets the system root. A relative root or plug-in is below the current directory.
/// Returns nullopt if the daemon must exit at once, because help or an error was printed; then status is the exit
/// status.
[[nodiscard]] std::optional<Options> readOptions(int count, const char* const* arguments, int& status);

/// The same for a process that is running already. Throws std::runtime_error with the description of a mistake.
[[nodiscard]] Options readOptionsAgain(const std::vector<std::string>& arguments);

/// The same with a configuration that was read elsewhere.
[[nodiscard]] Options readOptionsWith(const std::vector<std::string>& arguments,
                                      const ConfigurationText& configuration);

/// Gives the settings that only a start can change their old values. Returns the keys of those that differed.
std::vector<std::string> keepFixedSettings(Options& read, const Options& old);

/// Returns the text of a configuration file. Throws std::runtime_error with the file and a description.
[[nodiscard]] std::string configurationTextIn(const std::string& file);

/// Applies a configuration's text to the options. Throws std::runtime_error with the file, the line, the column and a
/// description.
void applyConfiguration(const std::string& file, const std::string& text, Options& options);

/// Both for a file.
void readConfiguration(const std::string& file, Options& options);

/// The path on disk of the configuration file that was read or, without one, where it would be.
[[nodiscard]] std::string configurationFile(const Options& options);

}  // namespace adminhost
