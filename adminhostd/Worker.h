#pragma once

// The worker: the process that loads the plug-ins and runs their operations, one at a time.
//
// It is started afresh by the front, on the other end of an inherited socket pair, has one thread, and ends when the
// front closes its end. What the frames carry:
//
//   configure  build (the front's, which must be the worker's), root, plugins (paths of files), languages, accountUuids
//   (host path), environment (of the tools) hello      plugins: [{name, version, file, commands: descriptions}],
//   refused: [{file, reason}], databaseTool: text of the
//              problem, absent when it works
//   perform    plugin, command, request, ifMatch (optional list of revisions), milliseconds (until the deadline),
//              wantsRevision, keep (what the settings' history says of this write)
//              or: query ("directory" with match or is, "history" with plugin)
//   answer     outcome: one of the words below; response, findings, revision, message as the outcome needs

namespace adminhost {

namespace outcome {
constexpr const char* nothing = "nothing";        ///< the operation answered nothing
constexpr const char* dictionary = "dictionary";  ///< response
constexpr const char* error = "error";            ///< response: the framework's error response
constexpr const char* refused = "refused";        ///< findings: the plug-in's check refuses the request
constexpr const char* changed = "changed";        ///< none of ifMatch is the revision; message
constexpr const char* overrun = "overrun";        ///< the deadline passed
constexpr const char* broken = "broken";          ///< message: the worker could not do it
}  // namespace outcome

/// Serves the front on this descriptor until it closes its end. Answers the process's exit status.
[[nodiscard]] int runWorker(int descriptor);

}  // namespace adminhost
