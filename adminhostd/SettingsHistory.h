#pragma once

// The history of a plug-in's settings and resources, for an administrator who wants to see or undo earlier changes.
//
// An entry of the settings holds their values before a write, who wrote when, the settings files byte for byte and,
// once the write is over, what it changed. It is stored before the write, so that a write that is killed has its entry
// too; a write that changed no setting has none. An edit that was made outside the daemon since the last write gets an
// entry of its own. An entry of the resources holds the changes that one request reported.
//
// Entries are numbered from 1 and never renumbered. Only root can enter the directory. Secrets are stored as keyed
// digests, which show that they changed; their values are only in the copies of the files, as the service stores them.
// Each entry names the format it is written in: older ones are read, newer ones are skipped.

#include "platform/files/Path.h"
#include "platform/framework/Plugin.h"
#include "platform/framework/Report.h"
#include "platform/value/Error.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

class SettingsHistory {
  public:
    static constexpr std::size_t settingsMaximum = 50;    ///< entries
    static constexpr std::size_t resourcesMaximum = 500;  ///< entries
    static constexpr std::int64_t format = 2;             ///< that this release writes

    /// `settings` are the keys that entries hold, secret ones marked.
    SettingsHistory(std::string_view plugin, std::vector<Setting> settings);

    /// Adds an entry before a write: the settings' values now, copies of the files that exist, and `about` ("when",
    /// "who", ...). Returns its number. On failure there is no new entry.
    [[nodiscard]] Result<std::uint64_t> keep(const std::vector<HostPath>& files, const Dictionary& values,
                                             const Dictionary& about) const;
    /// Adds to the entry the changes that the write made; removes the entry if there are none.
    [[nodiscard]] std::optional<Error> complete(std::uint64_t number, const Dictionary& values) const;
    /// Adds an entry of the resources with these changes. Those of the section "settings" are left out; if there are no
    /// others, no entry is added. A value that has become secret is replaced by "(secret)" in this and all stored
    /// entries; if one of them cannot be replaced, the others are, the entry is added, and the error is returned.
    /// `dropped` changes of the same request are not in the list; the entry has their number.
    [[nodiscard]] std::optional<Error> keepResources(const std::vector<Change>& changes, const Dictionary& about,
                                                     std::uint64_t dropped = 0) const;

    /// The entries, oldest first: `about` with "number", "settings" (a secret's value is "(secret)") and, for a write
    /// that has ended, "changes" ({"key", "from", "to"}; a secret's have "secret" and, in place of values, "(secret)"
    /// and "(secret) changed"). An entry of an edit outside has "outside": true. An entry that lacks one of its files
    /// or cannot be read is left out. Entries of a newer format are counted in one log line.
    [[nodiscard]] Array settingsEntries() const;
    /// The same for the resources: `about` with "number" and "changes", as requests report them, and, if there were too
    /// many changes to keep, "changesDropped", the number of the others.
    [[nodiscard]] Array resourceEntries() const;

    /// Removes the remains of a process that was killed while it added an entry; keep() does so too. No other process
    /// may be adding an entry at the same time.
    void removeUnfinished() const;

  private:
    /// The values in their stored form: "settings", and "digests" of the secret ones.
    [[nodiscard]] Result<Dictionary> snapshotOf(const Dictionary& values) const;
    [[nodiscard]] Result<std::string> digestKey() const;
    [[nodiscard]] std::optional<Error> keepOutsideEdit(const Dictionary& snapshot, const Dictionary& about) const;
    /// Adds an entry and returns its number.
    [[nodiscard]] Result<std::uint64_t> add(const std::vector<HostPath>& files, Dictionary about) const;
    [[nodiscard]] std::optional<Error> hideFormerValues(const std::vector<SecretPart>& secret) const;

    HostPath _directory;
    HostPath _resources;
    std::vector<Setting> _settings;
};

}  // namespace adminhost
