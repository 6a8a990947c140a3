#pragma once

// The interface between the daemon's worker and a plug-in: a shared object with one object of a class derived from
// Plugin, placed by ADMINHOST_PLUGIN.
//
// One thread makes all calls, and a plug-in is never unloaded. Any function may throw: the worker catches it, logs it
// and fails that one call ("INTERNAL_ERROR" if it was perform()). A file is loaded only if its note (BuildNote.h) names
// this interface. A running operation reports what it changes and what it does not carry out through Report.h; the
// tools that it starts are bound to the deadline of its request (platform/task).

#include "platform/files/Path.h"
#include "platform/framework/BuildNote.h"
#include "platform/framework/Export.h"
#include "platform/framework/PluginRequestHandler.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

/// The right that a client needs for a command. None implies another.
enum class Access : std::uint8_t {
    read,     ///< changes nothing
    write,    ///< changes settings or resources
    control,  ///< starts or stops something
    account,  ///< handles accounts or their passwords
};

struct ADMINHOST_EXPORT Command {
    std::string name;                 ///< last word of its address; unique in the plug-in
    Access access = Access::account;  ///< the strictest, in case that one is forgotten
    bool showsRevision = false;       ///< its response includes revision()
    bool takesRevision = false;       ///< accepts If-Match, and changes settings(): the host keeps their history
    std::vector<std::string> needs;   ///< names for probe(); each must be usable before perform() is called
    std::chrono::seconds deadline{};  ///< its own bound, if it is shorter than the daemon's; zero: none
    bool served = true;               ///< false: described for clients, but perform() has no operation for it yet
    /// For clients: summary, keys, answer, errors, example (commands/README.md). The host adds the members above.
    Dictionary description;

    bool operator==(const Command&) const = default;
};

/// One reason why a whole request is refused.
struct ADMINHOST_EXPORT Finding {
    std::string keyPath;  ///< "configuration.cameras.0.name"
    std::string rule;     ///< what is wrong
    std::string advice;   ///< how to fix it

    bool operator==(const Finding&) const = default;
};

/// Whether something that commands need is usable. Unknown (time-out, no memory) is not unusable: a client may send the
/// same request again.
struct ADMINHOST_EXPORT Probe {
    enum class State : std::uint8_t { usable, unusable, unknown };
    State state = State::usable;
    std::string reason;  ///< "/usr/bin/tool cannot be run (No such file or directory)"
    std::string fix;     ///< "install the package tool"
};

/// The result of one check of the installation.
struct ADMINHOST_EXPORT Diagnosis {
    enum class Health : std::uint8_t { ok, warning, failure };
    Health health = Health::ok;
    std::string name;   ///< "database"
    std::string found;  ///< one sentence
    std::string fix;    ///< empty if there is nothing to fix

    bool operator==(const Diagnosis&) const = default;
};

/// A setting whose history the host keeps: a key of Plugin::settings().
struct ADMINHOST_EXPORT Setting {
    std::string key;
    bool secret = false;
    std::size_t file = 0;  ///< index in Plugin::settingsFiles() of the file that stores it
};

/// A log file of the service.
struct ADMINHOST_EXPORT LogFile {
    std::string name;  ///< "access"
    HostPath path;
};

/// A configuration file that the plug-in's tools read.
struct ADMINHOST_EXPORT ToolFile {
    std::string path;  ///< below the directory that XDG_CONFIG_HOME names in toolFileVariables(): "tool/toolrc"
    std::string text;
};

class ADMINHOST_EXPORT Plugin {
  public:
    Plugin() = default;
    Plugin(const Plugin&) = delete;
    Plugin& operator=(const Plugin&) = delete;
    virtual ~Plugin() = default;

    /// The word in addresses: "lumio". Lower-case letters, digits, "-" and "_".
    [[nodiscard]] virtual std::string_view name() = 0;
    /// The plug-in's own release, "1.0.0".
    [[nodiscard]] virtual std::string_view version() = 0;
    /// The commands, in the order in which people read them. Called before configure(), perhaps in another process.
    [[nodiscard]] virtual std::vector<Command> commands() = 0;
    /// Called once, before any function below. The system root is set already. Languages for texts in answers, the
    /// preferred one first.
    virtual void configure(const std::vector<std::string>& languages) = 0;

    /// Returns everything that is wrong with a request; empty if perform() can carry it out. No side effect, no tool.
    [[nodiscard]] virtual std::vector<Finding> check(std::string_view command, const Dictionary& request) = 0;
    /// Serves one command of commands().
    [[nodiscard]] virtual Response perform(std::string_view command, const Dictionary& request) = 0;

    /// Returns whether something that commands need under this name is usable. Called before each command that needs
    /// it: a plug-in should keep a result that took long to find out, and check again only while it is not usable. Its
    /// tools are killed after 5 seconds.
    [[nodiscard]] virtual Probe probe(std::string_view /*need*/) { return {}; }
    /// Checks of the installation, for an administrator. Each ends within 2 seconds.
    [[nodiscard]] virtual std::vector<Diagnosis> diagnose() { return {}; }
    /// A short digest of what reading settings would show now; empty if the plug-in does not have one.
    [[nodiscard]] virtual std::string revision() { return {}; }

    /// The settings whose history the host keeps, in the order in which people read them.
    [[nodiscard]] virtual std::vector<Setting> settingKeys() { return {}; }
    /// The values of these settings as reading shows them now, without those that are not set. The value of a secret is
    /// its stored (enciphered) form. On an error the host adds no entry and logs the reason.
    [[nodiscard]] virtual Result<Dictionary> settings() { return Dictionary(); }
    /// The files in which these settings are stored, whatever their format; some may not exist. The host copies them
    /// byte for byte into each entry of the history, and removes what an unfinished write left beside them.
    [[nodiscard]] virtual std::vector<HostPath> settingsFiles() { return {}; }

    [[nodiscard]] virtual std::vector<LogFile> logs() { return {}; }
    /// Files that an interrupted operation may have left, on a local file system: one that hangs would hold up every
    /// request. The host removes them after a worker's start, and what is left beside settingsFiles() before the first
    /// command that may change something.
    [[nodiscard]] virtual std::vector<HostPath> leftovers() { return {}; }
    /// The host writes these files before the first tool is run, in a private directory.
    [[nodiscard]] virtual std::vector<ToolFile> toolFiles() { return {}; }
};

}  // namespace adminhost

/// Defines the plug-in's note and its entry point for a class derived from Plugin. Once in a plug-in, at namespace
/// scope.
#define ADMINHOST_PLUGIN(PluginClass)                                                                              \
    extern "C" {                                                                                                   \
    __attribute__((used, aligned(4),                                                                               \
                   section(".note.adminhost"))) static constinit const adminhost::BuildNote adminhost_build_note = \
        adminhost::makeBuildNote(ADMINHOST_BUILD_IDENTITY);                                                        \
    __attribute__((visibility("default"))) adminhost::Plugin* adminhost_plugin() {                                 \
        static PluginClass plugin;                                                                                 \
        return &plugin;                                                                                            \
    }                                                                                                              \
    }
