#pragma once

// The request handler: the operations through which administrators reach the service.
//
// An operation that serves a command has the command's name followed by WithRequest. It blocks until its response is
// built and reports failure in that response. Nothing is kept between requests. Every log line of this room starts
// with "adminhost_lumio: ". Each operation is in the source file of its group.

#include "platform/framework/PluginRequestHandler.h"
#include "platform/value/Error.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"
#include "settings/SettingsStore.h"

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {
class NetService;
}

namespace lumio {

/// The error of a failed settings write.
struct SettingsWriteError {
    std::string domain;  ///< always empty
    std::int64_t code = 400;
    adminhost::Error underlying;  ///< of serialising or writing; its description is the text for administrators
};

class LumioRequestHandler : public adminhost::PluginRequestHandler, public SettingsStore {
  public:
    using Array = adminhost::Array;
    using Dictionary = adminhost::Dictionary;
    using Response = adminhost::Response;
    using Value = adminhost::Value;

    // Settings (ReadSettings.cpp, WriteSettings.cpp)

    /// "readStatus", the preferences setup script's status, and "configuration", narrowed by
    /// "optionalArguments.variant".
    [[nodiscard]] Response readSettingsWithRequest(const Dictionary& request);
    /// Applies "configuration" and returns what a read would now return, with "readStatus" 0, "writeStatus" and, if
    /// they apply, "errorDescription" and "needsRecycleOrRestart". Resource changes are applied whatever the write
    /// status.
    [[nodiscard]] Response writeSettingsWithRequest(const Dictionary& request);

    // Service state and control (State.cpp); the variant may be null

    /// "state" with two version numbers, and the details if "variant" is "withDetails". What cannot be found out is
    /// absent, or counts as 0: this is never an error.
    [[nodiscard]] Response getStateWithRequest(const Dictionary& request);
    /// The paths of the service's log files by name.
    [[nodiscard]] Response getLogPathsWithRequest(const Dictionary& request);
    /// No response, or the error "CANNOT_START_SERVICE_ERR". The variant is not read.
    [[nodiscard]] Response startServiceWithVariant(const Value& variant);
    /// The state, with "state" always "STOPPED", or the error "CANNOT_STOP_SERVICE_ERR".
    [[nodiscard]] Response stopServiceWithVariant(const Value& variant);
    /// Does nothing and returns no response.
    [[nodiscard]] Response recycleServiceWithVariant(const Value& variant);

    // Settings that depend on the outside world (Validation.cpp)

    /// Tries the proposed shared file system and grid controller, each if it is given. Every failure is an error key.
    [[nodiscard]] Response validateSettingsWithRequest(const Dictionary& request);

    // The grid's account (GridAccount.cpp)

    /// Creates the account in a directory node, in place of an earlier one of this server, and returns its name and
    /// password, or "errorCode" and "error". Nothing that was done before a failure is undone.
    [[nodiscard]] Response createNimboAccountWithRequest(const Dictionary& request);

    // Resources (ResourceRequests.cpp)

    /// "command", the list and "readStatus" 0; on failure only "readStatus", the error's code.
    [[nodiscard]] Response getWorkflowsWithRequest(const Dictionary& request);
    [[nodiscard]] Response getCamerasWithRequest(const Dictionary& request);
    /// "resources": every camera and workflow with its access list as the database has it (resources/AccessOverview.h).
    [[nodiscard]] Response getAccessWithRequest(const Dictionary& request);
    /// Removes an account that the directory does not know from access lists; "removed" and "writeStatus".
    [[nodiscard]] Response removeAccessWithRequest(const Dictionary& request);
    [[nodiscard]] Response getPropertiesWithRequest(const Dictionary& request);
    // Each applies an array of change records, entry by entry; null does nothing. They return no response.
    Response setWorkflowACLWithRequest(const Array* changes);
    Response processCameraChangesWithRequest(const Array* changes);
    Response processPropertyChangesWithRequest(const Array* changes);

    // Pieces of reading settings

    // Each adds its file's share to the configuration; a file that cannot be loaded adds nothing.
    void copyIdentityPreferencesToConfig(Dictionary& config) const;
    void copyClusterPreferencesToConfig(Dictionary& config) const;
    void copyMemberPreferencesToConfig(Dictionary& config) const;
    void copyLibraryInformationToConfig(Dictionary& config) const;
    /// The grid client's password in plain text; nullopt if it is not set or cannot be deciphered.
    [[nodiscard]] static std::optional<std::string> nimboClientPasswordFromPrefs(const Dictionary& prefs);
    /// Stores each value that the source has under one of the keys. A key that the source lacks leaves the destination
    /// unchanged.
    static void copyKeys(const std::vector<std::string_view>& keys, const Dictionary& source, Dictionary& destination);
    // The keys that are read from, and written to, each file. The library's are only read.
    [[nodiscard]] static std::vector<std::string_view> identityPreferencesKeysToCopy();
    [[nodiscard]] static std::vector<std::string_view> libraryInformationKeysToCopy();
    [[nodiscard]] static std::vector<std::string_view> memberPreferencesKeysToCopy();
    [[nodiscard]] static std::vector<std::string_view> clusterPreferencesKeysToCopy();

    /// The library's keys and those that reading adds: a write ignores them.
    [[nodiscard]] static std::vector<std::string_view> keysThatAreOnlyRead();

    // Pieces of writing settings

    // Each runs the service's setup script of that name and drops its output. Returns its exit status, 0 on success.
    [[nodiscard]] std::int32_t setupPreferences() const;
    [[nodiscard]] std::int32_t setupLibrary() const;
    // Each writes its file's share of the configuration. Returns 0, or the status of a failed write, and then sets
    // "errorDescription" in the result. Sets "needsRecycleOrRestart" there if the change needs it, also before a write
    // that fails. The password is removed from the configuration, and is stored only in its protected form.
    [[nodiscard]] std::int32_t setIdentityPreferencesFromConfig(Dictionary& config, Dictionary& result);
    [[nodiscard]] std::int32_t setClusterPreferencesFromConfig(Dictionary& config, Dictionary& result);
    [[nodiscard]] std::int32_t setMemberPreferencesFromConfig(Dictionary& config, Dictionary& result);
    // Each replaces its file atomically (platform/plist). A file that cannot be loaded is kept beside the new one.
    [[nodiscard]] std::optional<SettingsWriteError> writeIdentityPreferences(const Dictionary& prefs);
    [[nodiscard]] std::optional<SettingsWriteError> writeClusterPreferences(const Dictionary& prefs);
    [[nodiscard]] std::optional<SettingsWriteError> writeMemberPreferences(const Dictionary& prefs);
    /// Creates the setup-done marker, and its directory, if it is missing. Failures are logged.
    void markSetupDone();
    /// Returns true if the setup-done marker exists.
    [[nodiscard]] bool checkSetupDone() const;
    /// Resolves the grid controller's DNS-SD name to the host name of its first address (ControllerName.cpp), within
    /// about ten seconds. A failure is logged where the resolver or the look-up reported it; the error has the reason.
    [[nodiscard]] adminhost::Result<std::string> hostNameOfController(const std::string& name);
    // The resolver's callbacks, made on the calling thread while hostNameOfController waits.
    void netService(const adminhost::NetService& service, const Dictionary& didNotResolve);
    void netServiceDidStop(const adminhost::NetService& service);

    // Pieces of the state

    /// "kNotConfigured" if a value is missing; an empty one is not. Else runs checkNimboController().
    [[nodiscard]] std::string_view getStateOfNimboController(const std::optional<std::string>& controller,
                                                             const std::optional<std::string>& username,
                                                             const std::optional<std::string>& password);
    /// "kNotConfigured" without a path. Else runs validateSharedFilesystem().
    [[nodiscard]] std::string_view getStateOfSharedFileSystemPath(const std::optional<std::string>& path,
                                                                  const std::optional<std::string>& owner);
    /// In bytes.
    [[nodiscard]] static std::optional<std::uint64_t> getFreeSpaceOfSharedFileSystem(
        const std::optional<std::string>& path);
    /// The creation date of the service's pid file.
    [[nodiscard]] static std::optional<adminhost::Date> getStartTime();
    // Numbers of grid jobs. A failure is logged and counts 0.
    [[nodiscard]] static std::uint64_t getTotalJobs();
    [[nodiscard]] static std::uint64_t getRunningJobs();
    /// "updated_at", "created_at", "used_at": the resources' own date keys. No operation calls it.
    [[nodiscard]] static std::vector<std::string_view> listOfResourceDateKeys();

    // Checks

    /// Creates a file in the directory, gives it to the owner (null: leaves its owner) and removes it. Returns 0, or
    /// the step that failed: 1 the path is not a directory, 2 creating, 3 changing the owner, 4 removing.
    [[nodiscard]] std::uint32_t validateSharedFilesystem(const std::string& path,
                                                         const std::optional<std::string>& owner);
    /// Gets a Kerberos ticket for the account and lists the controller's grids with it (ControllerCheck.cpp). Returns
    /// 0 if there is a grid; 1 if the directory names no principal for the account; 2 if the tool printed no grid; 3 if
    /// no ticket had to be acquired or the cache cannot be used; else the grid tool's status. `error` receives the
    /// tool's error output. No ticket is left.
    [[nodiscard]] std::int32_t checkNimboController(const std::string& controller, const std::string& username,
                                                    std::string_view password, std::string* error);
    /// The values of one attribute of a user's record; nullopt if there is none, or if the directory fails.
    [[nodiscard]] static std::optional<std::vector<std::string>> getAttribute(std::string_view attribute,
                                                                              const std::string& username);
    /// The tickets of a running checkNimboController(). A worker that is killed may leave the file.
    [[nodiscard]] static adminhost::HostPath credentialCachePath();

  protected:
    [[nodiscard]] std::string messageForError(std::string_view code) const override;

  private:
    /// Runs the setup scripts and writes the three files, up to the first step that fails. Returns the status of the
    /// last step.
    [[nodiscard]] std::int32_t writeSettingsFiles(Dictionary& config, Dictionary& result);

    /// The dictionary of the resolver's most recent did-not-resolve callback.
    std::optional<Dictionary> mBJError;
};

}  // namespace lumio
