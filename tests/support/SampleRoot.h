#pragma once

// A root directory of the sample service for one test, created by demo/make-root in a temporary directory of its own
// (below TMPDIR). The destructor ends the daemons that the stand-ins left behind and removes the directory.
//
// A failure to prepare it throws std::runtime_error, and the test fails with its text.

#include "platform/files/Path.h"

#include <map>
#include <optional>
#include <string>
#include <vector>

namespace adminhost::test {

/// Sizes of the sample library; without a size, the library has its usual content.
struct SampleSizes {
    std::optional<int> cameras;
    std::optional<int> workflows;
    std::optional<int> properties;
    std::optional<int> jobs;
    std::optional<int> accessEntries;  ///< for each camera and workflow
    std::optional<int> accounts;
};

/// One recorded run of a stand-in.
struct ToolCall {
    std::string tool;  ///< its host path
    std::vector<std::string> arguments;
    std::map<std::string, std::string> environment;  ///< KRB5CCNAME, if it was set

    friend bool operator==(const ToolCall&, const ToolCall&) = default;
};

class SampleRoot {
  public:
    explicit SampleRoot(const SampleSizes& sizes = {});
    ~SampleRoot();
    SampleRoot(const SampleRoot&) = delete;
    SampleRoot& operator=(const SampleRoot&) = delete;

    [[nodiscard]] const std::string& path() const noexcept { return _path; }  ///< without a slash at the end
    [[nodiscard]] const std::string& directory() const noexcept {
        return _base;
    }  ///< holds the root: room for a test's own files

    /// The disk path of a host path ("/var/lumio/server"). Independent of the process's system root.
    [[nodiscard]] std::string disk(const std::string& hostPath) const { return _path + hostPath; }

    [[nodiscard]] std::string databasePath() const;             ///< disk path
    [[nodiscard]] std::string sharedFilesystemPath() const;     ///< disk path
    [[nodiscard]] std::string memberPreferencesPath() const;    ///< disk path
    [[nodiscard]] std::string clusterPreferencesPath() const;   ///< disk path
    [[nodiscard]] std::string identityPreferencesPath() const;  ///< disk path

    /// Runs SQL through the real sqlite3 tool and returns its output in list mode ("a|b" lines). Throws if the tool
    /// fails.
    std::string sql(const std::string& statements) const;

    /// A file's whole content; throws if it cannot be read.
    [[nodiscard]] std::string read(const std::string& hostPath) const;
    /// Writes a file, with its directories. A link there (the SQL tool's) is replaced, never followed.
    void write(const std::string& hostPath, const std::string& content) const;
    void remove(const std::string& hostPath) const;  ///< a file or a whole directory; may be missing
    /// Removes a user from the account files. The access lists keep the user's UUID.
    void removeAccount(const std::string& name) const;

    /// Sets a switch of a stand-in, for example ("lumioctl.exit", "3"). See demo/README.md.
    void setSwitch(const std::string& name, const std::string& content) const;
    void clearSwitches() const;
    /// Lets the stand-in with this switch name ("setup_library") wait in its next run until it is released or the
    /// switches are cleared, so that a test can act at a known point of an operation.
    void hold(const std::string& tool) const;
    void release(const std::string& tool) const;
    /// Waits until the held stand-in is running. Returns false after 30 seconds.
    [[nodiscard]] bool waitForHeld(const std::string& tool) const;
    /// The id of the process that a "NAME.daemon" switch left behind; nullopt if it is not running.
    [[nodiscard]] std::optional<int> daemonLeftBy(const std::string& switchName) const;

    /// The stand-ins record their calls from now on. Earlier records are removed.
    void recordToolCalls() const;
    [[nodiscard]] std::vector<ToolCall> toolCalls() const;  ///< in their order

    /// The UUID that the sample service uses for a user ("user", "anna") or group ("group", "editors") of its account
    /// files, and for a camera ("camera", name) or workflow ("workflow", directory name) of the library.
    [[nodiscard]] static std::string uuidOf(const std::string& kind, const std::string& name);

  private:
    std::string _base;
    std::string _path;
};

}  // namespace adminhost::test
