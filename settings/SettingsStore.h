#pragma once

// Where the service keeps its settings and its database, and the loaders of its four settings files.
//
// Every call reads the disk again. No operation reports an error: a file that cannot be read or parsed, or whose top
// level is not a dictionary, counts as missing, and there is always a database path.

#include "platform/files/Path.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <optional>
#include <string>
#include <string_view>

namespace lumio {

class SettingsStore {
  public:
    static constexpr std::string_view defaultSharedFilesystem = "/Library/SorvaneProducer/Shared";
    static constexpr std::string_view stateDirectory = "/var/lumio/server";

    /// The identity preferences' "shared_filesystem" exactly as stored, never normalised; the default shared file
    /// system if it is not set.
    [[nodiscard]] static std::string sharedFilesystemPath();
    /// The identity preferences' "member_uuid".
    [[nodiscard]] static std::optional<std::string> memberUUID();

    [[nodiscard]] static adminhost::HostPath identityPreferencesPath();
    [[nodiscard]] static adminhost::HostPath libraryInformationPath();
    [[nodiscard]] static adminhost::HostPath memberPreferencesPath();
    [[nodiscard]] static adminhost::HostPath clusterPreferencesPath();

    [[nodiscard]] static std::optional<adminhost::Dictionary> identityPreferences();
    [[nodiscard]] static std::optional<adminhost::Dictionary> libraryInformation();
    /// The file on the shared file system if an entry of its name exists there, readable or not; else the cached copy.
    [[nodiscard]] static std::optional<adminhost::Dictionary> memberPreferences();
    /// As memberPreferences.
    [[nodiscard]] static std::optional<adminhost::Dictionary> clusterPreferences();

    // For a write, which must not treat a file that could not be read as one that does not exist.

    /// Loads a settings file. Returns nullopt if it does not exist; fails, with the reason, if it exists but cannot be
    /// read or parsed, or is not a dictionary.
    [[nodiscard]] static adminhost::Result<std::optional<adminhost::Dictionary>> stored(
        const adminhost::HostPath& path);
    /// The same for the identity preferences. The service may be rewriting them at this moment: tries a second and a
    /// third time, 50 ms apart, before it fails.
    [[nodiscard]] static adminhost::Result<std::optional<adminhost::Dictionary>> storedIdentity();
    // The places that these identity preferences name, so that a write reads them once for all decisions.
    [[nodiscard]] static adminhost::HostPath memberPreferencesPath(
        const std::optional<adminhost::Dictionary>& identity);
    [[nodiscard]] static adminhost::HostPath clusterPreferencesPath(
        const std::optional<adminhost::Dictionary>& identity);
    [[nodiscard]] static adminhost::HostPath cachedMemberPreferencesPath();
    [[nodiscard]] static adminhost::HostPath cachedClusterPreferencesPath();

    /// The service's database file: the production entry of the location file, else "Server/db.sqlite3" on the shared
    /// file system. A relative path is returned unchanged. A location file above 1 MiB counts as unreadable.
    [[nodiscard]] static adminhost::HostPath dbPath();
    /// Returns true if a file system entry exists at dbPath.
    [[nodiscard]] static bool dbPathExists();
};

}  // namespace lumio
