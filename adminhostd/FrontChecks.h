#pragma once

// The checks of the installation that the front makes itself, so that they are answered also while no worker runs.
//
// They read the daemon's own files and the kernel's state. None of them waits for another program or for a file system
// of the service.

#include "adminhostd/Options.h"
#include "adminhostd/Protocol.h"
#include "platform/framework/Plugin.h"

#include <chrono>
#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include <sys/stat.h>
#include <sys/statvfs.h>
#include <sys/timex.h>
#include <sys/types.h>
#include <unistd.h>

namespace adminhost {

class FrontChecks {
  public:
    /// What the front knows of its workers.
    struct Workers {
        std::optional<pid_t> pid;
        std::optional<std::string> problem;  ///< why none can serve
        std::vector<std::string> plugins;
        std::vector<protocol::RefusedPlugin> refused;
    };

    /// Remembers the socket as it is now. Created after the socket, and before the front changes its account.
    explicit FrontChecks(const Options& options);
    /// Applies options that have been read again.
    void reconfigure(const Options& options);

    [[nodiscard]] std::vector<Diagnosis> run(const Workers& workers) const;

  private:
    struct Seen {
        std::string path;  ///< empty: there is none
        dev_t device = 0;
        ino_t inode = 0;

        [[nodiscard]] static Seen now(const std::string& path);
    };

    [[nodiscard]] Diagnosis daemonCheck() const;
    [[nodiscard]] Diagnosis socketCheck() const;
    [[nodiscard]] Diagnosis configurationCheck() const;

    std::string _root;
    uid_t _account = ::geteuid();  ///< of the daemon
    Seen _socket;
    std::string _configuration;          ///< path; empty: none
    std::string _configurationText;      ///< that is in effect
    bool _configurationIsNamed = false;  ///< on the command line: other rules apply to who may write to it
    std::vector<std::pair<std::string, std::string>> _directories;  ///< what for, and the path on disk
    std::chrono::system_clock::time_point _started = std::chrono::system_clock::now();
};

// The rules of single checks.

/// The clock: `state` and `clock` are adjtimex()'s result and data. `reported`: the time service has reported that the
/// clock is synchronised, which counts if the daemon may not ask the kernel.
[[nodiscard]] Diagnosis clockCheck(int state, const timex& clock, bool reported);
/// The space that is left for a directory; `name` is the check's, `effect` the sentence with what happens without any.
[[nodiscard]] Diagnosis spaceCheck(const std::string& name, const std::string& directory, const struct statvfs& space,
                                   const std::string& effect = "Changes cannot be stored.");

}  // namespace adminhost
