#pragma once

// The interface between the administration daemon's worker and a plug-in.
//
// A plug-in is a shared object that exports adminhost_plugin() and carries the note of the build that it belongs to
// (ADMINHOST_PLUGIN places both). The worker reads the note from the file and loads a plug-in of its own build only, so
// no code of another build ever runs. All calls come from one thread; a plug-in is never unloaded. No function lets an
// exception out: an operation that fails inside answers the error response "INTERNAL_ERROR" after logging why.

#include "platform/files/Path.h"
#include "platform/framework/BuildNote.h"
#include "platform/framework/PluginRequestHandler.h"
#include "platform/value/Value.h"

#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

/// What a plug-in's check has to say of one place of a request.
struct Finding {
    std::string keyPath;  ///< "configuration.properties.0.name"
    std::string rule;     ///< what does not fit
    std::string advice;   ///< what to do about it
};

struct Plugin {
    const char* name;     ///< the word in the daemon's addresses: "lumio"
    const char* version;  ///< the release, "1.0.0"
    /// The command descriptions: an array of dictionaries, in the order people read them (commands/README.md). The
    /// daemon reads "name", "needsDatabase" (refused while the database tool is unusable), "revision" (the answer
    /// carries revision()) and "revisionGuard" (a client may name the revision that must still hold); a missing flag is
    /// false.
    Value (*describe)() noexcept;
    /// Whether the operations can carry the request: everything that is wrong with it, empty when nothing is.
    std::vector<Finding> (*check)(std::string_view command, const Dictionary& request) noexcept;
    /// A short digest of what reading settings would show now; empty when the plug-in keeps no revision.
    std::string (*revision)() noexcept;
    /// Serves one command of describe().
    Response (*perform)(std::string_view command, const Dictionary& request) noexcept;
    /// The files that commands with "revisionGuard" replace, whose top-level keys are those of the request's
    /// "configuration"; the daemon keeps their history. Null when there is none to keep.
    std::vector<HostPath> (*settingsFiles)() noexcept = nullptr;
};

}  // namespace adminhost

/// Defines the plug-in's note and its entry point; stands once in a plug-in, at namespace scope.
#define ADMINHOST_PLUGIN(plugin)                                                                                   \
    extern "C" {                                                                                                   \
    __attribute__((used, aligned(4),                                                                               \
                   section(".note.adminhost"))) static constinit const adminhost::BuildNote adminhost_build_note = \
        adminhost::makeBuildNote(ADMINHOST_BUILD_IDENTITY);                                                        \
    __attribute__((visibility("default"))) const adminhost::Plugin* adminhost_plugin() noexcept {                  \
        return &(plugin);                                                                                          \
    }                                                                                                              \
    }
