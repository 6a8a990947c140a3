#pragma once

// A small service whose settings are written by a second process of this program: with --write it writes the settings
// once, between the two marks in the trace.

#include "tests/support/CapturedLog.h"
#include "tests/support/TemporaryRoot.h"

#include <array>
#include <cstdint>
#include <filesystem>
#include <map>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace lumio {

constexpr std::string_view identityFile = "/Library/Preferences/com.brenn.lumioserverd.plist";
constexpr std::string_view clusterFile = "/shared/Server/cluster_preferences.plist";
constexpr std::string_view memberFile = "/shared/Server/member_preferences_M.plist";
/// In the order in which they are written.
constexpr std::array<std::string_view, 3> settingsFiles{identityFile, clusterFile, memberFile};

/// The bytes of the settings files by host path; one that is missing has no entry.
using Contents = std::map<std::string_view, std::string>;

/// Statuses of the writing process.
enum Outcome : int { written = 0, refused = 1, otherStatus = 2 };

class Service {
  public:
    Service();

    /// Restores the original settings, without the marker, and removes all other files beside them.
    void makeOld() const;
    void makeWithoutFiles() const;
    /// Runs a process that writes the new settings and returns its status. If a number is given, each file may have so
    /// many bytes.
    std::int32_t writeAlone(const std::optional<std::string>& bytes = std::nullopt);
    /// The same below strace, with these options and this log.
    std::int32_t writeTraced(const std::vector<std::string>& options, const std::string& logFile);
    /// Writes the new settings in this process. Returns true on success.
    [[nodiscard]] bool writeHere() const;

    [[nodiscard]] Contents contents() const;
    /// The names of other files beside the settings files.
    [[nodiscard]] std::vector<std::string> others() const;
    [[nodiscard]] bool marked() const;
    /// The output of the process: its log, and the answer's "errorDescription" in the last line.
    [[nodiscard]] const std::string& said() const { return _said; }

    adminhost::test::TemporaryRoot root;
    adminhost::test::CapturedLog log;

  private:
    [[nodiscard]] std::vector<std::string> writer() const;

    std::string _said;
};

/// The writing process itself.
int writeBetweenMarks(const std::vector<std::string>& arguments);

}  // namespace lumio
