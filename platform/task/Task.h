#pragma once

// Child processes: run a tool to completion, without a shell. TaskGroup.h runs several at once.
//
// Each function blocks until the tool has exited and returns its exit status; a death by signal is 128 + the signal's
// number. A tool that cannot be started (missing, not executable, its path not absolute, an argument with a NUL byte or
// above the kernel's 128 KiB with the NUL that ends it) is -1, with "TOOL: " and the system's text in the captured
// error, TOOL being the tool's host path. The tool gets exactly the given arguments (argv[0] is the tool's path on
// disk), standard input /dev/null where no input is given, no signal blocked or ignored, no descriptor of ours, and the
// daemon's environment extended by the given one. Left out of the daemon's are the variables with which it finds its
// credentials, sockets, tickets and directory servers (CREDENTIALS_DIRECTORY, LISTEN_*, KRB5CCNAME, KRB5_CLIENT_KTNAME,
// LDAP*). Its umask and current directory are the process's, which prepareForTasks() has set to 022 and "/": a relative
// path names the same file here and there. A tool need not read its input: the rest is dropped.
//
// Standard output and error are captured whole, up to 256 MiB together. More is a failure, never a truncation: the
// tool's process group is killed and -1 returned. Bytes that are not UTF-8 become U+FFFD each and are lost, because
// captured text must fit into a property list. A tool may leave a daemon behind that holds the pipes. In that case,
// once the tool itself has exited, the content of the pipes is read, at most 200 ms are waited for more, and the daemon
// keeps running (its later output meets a closed pipe).
//
// A null place for captured text means that the stream is read and dropped, within the same bound. Places are
// replaced, not appended to. After a failure both are empty, except for the error's text.

#include "platform/files/Path.h"
#include "platform/framework/Export.h"

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

[[nodiscard]] ADMINHOST_EXPORT std::int32_t launch_task(const DiskPath& tool, const std::vector<std::string>& arguments,
                                                        std::string* output, std::string* error);

[[nodiscard]] ADMINHOST_EXPORT std::int32_t launch_task_with_input(const DiskPath& tool,
                                                                   const std::vector<std::string>& arguments,
                                                                   const std::optional<std::string>& input,
                                                                   std::string* output, std::string* error);

[[nodiscard]] ADMINHOST_EXPORT std::int32_t launch_task_with_input_and_environment(
    const DiskPath& tool, const std::vector<std::string>& arguments, const std::optional<std::string>& input,
    std::string* output, std::string* error, const std::map<std::string, std::string>& environment);

/// Prepares the process for launching tools: umask 022, current directory "/", and SIGCHLD, which the process may have
/// inherited as ignored (exit statuses would be lost), at its default. Called once at the start of a process that
/// launches tools.
ADMINHOST_EXPORT void prepareForTasks() noexcept;

/// The moment at which a running tool of this process is killed with its process group (status 128 + 9, and no further
/// tool is started: -1); nullopt means no bound. It applies to tools started after the call. The worker sets it for
/// each request.
ADMINHOST_EXPORT void setTaskDeadline(std::optional<std::chrono::steady_clock::time_point> deadline) noexcept;

/// The variables by which a tool finds the plug-in's toolFiles(). They go into the plan of a tool that reads such
/// files, and of no other: a service that is started by its control tool would keep them for life. Empty outside the
/// worker.
[[nodiscard]] ADMINHOST_EXPORT const std::map<std::string, std::string>& toolFileVariables() noexcept;
/// The worker sets them before each call of a plug-in.
ADMINHOST_EXPORT void setToolFileVariables(std::map<std::string, std::string> variables);

}  // namespace adminhost
