#pragma once

// The history of settings: what the settings files held before each write, for an administrator who wants to look or go
// back.
//
// Entries are numbered from 1 and never renumbered; the last 50 are kept, in a directory that only root can enter. Each
// holds the files byte for byte, and who wrote when. It is kept before the write; a write that then failed has its
// entry too.

#include "platform/files/Path.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <optional>
#include <vector>

namespace adminhost {

constexpr std::size_t historyMaximum = 50;  ///< entries

/// Where the entries of a plug-in lie.
[[nodiscard]] HostPath historyDirectory(std::string_view plugin);

/// Adds an entry: copies of the files that exist, and `about` ("when", "who", "settings": their values, secrets
/// replaced, ...). Entries beyond the maximum are
/// removed, the oldest first. On failure there is no new entry, and the error says which step failed and why.
[[nodiscard]] std::optional<Error> keepHistory(const HostPath& directory, const std::vector<HostPath>& files,
                                               const Dictionary& about);

/// Removes what a process that was killed while it added an entry left; keepHistory() does so too. No entry of another
/// process may be in the making.
void removeUnfinishedHistory(const HostPath& directory);

/// The entries, oldest first: `about` with "number" (an integer) and "settings"; in an entry of an earlier release
/// these are the top-level keys of the entry's files in one dictionary. Of these only the named ones are answered; a
/// secret's value is the text "(secret)". What cannot be read of an entry is left out.
[[nodiscard]] Array readHistory(const HostPath& directory, const std::vector<std::string>& keys,
                                const std::vector<std::string>& secrets);

}  // namespace adminhost
