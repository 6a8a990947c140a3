#pragma once

// Trying plug-ins before they are loaded: a file that crashes or never returns costs a child process, not the worker.

#include "platform/files/Path.h"

#include <chrono>
#include <optional>
#include <string>
#include <vector>

namespace adminhost {

/// Loads each file in a child process of its own, all at the same time, and asks it for its name and commands
/// (loadPlugin). Returns for each file why it cannot be used, naming the file; nullopt if it can. A child that has not
/// finished after `bound` is killed with its process group. No child is left. For the worker only: the children run its
/// program with serveTrial(). Throws std::system_error if a child cannot be started, which is not the file's fault.
[[nodiscard]] std::vector<std::optional<std::string>> tryPlugins(
    const std::vector<DiskPath>& files, std::chrono::milliseconds bound = std::chrono::seconds(5));

/// The first argument of a worker program that only tries a file; the second one is the file.
constexpr const char* trialArgument = "--try";

/// The main function of such a process. Returns its exit status.
[[nodiscard]] int serveTrial(const char* file);

}  // namespace adminhost
