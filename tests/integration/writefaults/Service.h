#pragma once

// A small service whose settings are written by this program, run once more as a process of its own: with --write it
// writes the settings once, between the two marks of a traced way.

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

    /// Puts the settings back as they were, without the marker, and removes whatever else stands beside them.
    void makeOld() const;
    void makeWithoutFiles() const;
    /// A process that writes the new settings, each of its files bounded to so many bytes if a number is given. Its
    /// status.
    std::int32_t writeAlone(const std::optional<std::string>& bytes = std::nullopt);
    /// The same below strace, with its options and its log.
    std::int32_t writeTraced(const std::vector<std::string>& options, const std::string& logFile);
    /// Writes the new settings in this process; whether that succeeded.
    [[nodiscard]] bool writeHere() const;

    [[nodiscard]] Contents contents() const;
    /// What stands beside the settings files, by name.
    [[nodiscard]] std::vector<std::string> others() const;
    [[nodiscard]] bool marked() const;
    /// What the process said: its log, and the answer's "errorDescription" in the last line.
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
