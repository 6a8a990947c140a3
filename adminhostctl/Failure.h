#pragma once

// Failures of the command line, and its exit statuses.

#include <stdexcept>
#include <string>

namespace adminhost::ctl {

enum class ExitStatus : int {
    done = 0,
    failed = 1,  ///< the service returned an error, or something was not applied
    usage = 2,
    notReachable = 3,  ///< no daemon at the socket, or it does not answer
    notPermitted = 4,
    changes = 5,           ///< only with --exit-code: something differs, or was changed
    hostNotReachable = 8,  ///< the machine of --host, or its adminhostctl, cannot be reached
    conflict = 7,          ///< another client has changed the state since it was read; nothing was written
    undetermined = 6,  ///< the answer to a write is missing, and whether everything was written cannot be determined

    // Of "doctor", which has numbers of its own.
    warnings = 1,
    failures = 2,
    notChecked = 3,  ///< the daemon cannot be asked

    // Of "status": those that init scripts use.
    runningWithIssue = 1,
    stopped = 3,
    unknown = 4,  ///< also if the daemon cannot be asked
};

/// Ends the program with a message for people and a status; caught in one place, main().
class Failure : public std::runtime_error {
  public:
    Failure(ExitStatus status, const std::string& message) : std::runtime_error(message), _status(status) {}
    [[nodiscard]] ExitStatus status() const noexcept { return _status; }

  private:
    ExitStatus _status;
};

/// The daemon cannot be asked now; it may be possible soon.
class Unavailable : public Failure {
  public:
    using Failure::Failure;
};

/// The failure of a command line that cannot be carried out.
[[nodiscard]] inline Failure usageError(const std::string& message) {
    return {ExitStatus::usage, message};
}

}  // namespace adminhost::ctl
