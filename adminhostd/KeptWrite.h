#pragma once

// The history of a write: the entry with which it begins, and what it has changed.
//
// A history that cannot be written does not stop a write: on a full disk, this write may be what fixes it. The failure
// is logged and reported.

#include "adminhostd/ForwardingSink.h"
#include "adminhostd/PluginFile.h"
#include "adminhostd/SettingsHistory.h"

#include <cstdint>
#include <optional>

namespace adminhost {

/// The history of the settings that the plug-in names.
[[nodiscard]] Result<SettingsHistory> historyOf(const LoadedPlugin& loaded);

class KeptWrite {
  public:
    /// `about` describes the request: "when", "who", "uid", "command" and "request".
    KeptWrite(const LoadedPlugin& loaded, Dictionary about) : _loaded(loaded), _about(std::move(about)) {}

    /// Adds the entry with the settings before the write.
    void begin();
    /// Adds what the write has changed: the settings to the entry, if there is one, and the other changes.
    void complete(const ReportedChanges& changes) const;

  private:
    const LoadedPlugin& _loaded;
    Dictionary _about;
    std::optional<std::uint64_t> _entry;
};

}  // namespace adminhost
