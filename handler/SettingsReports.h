#pragma once

// Reports of a write of the settings: the keys that are changed on disk, and those that were not written.

#include "platform/value/Value.h"

#include <string>
#include <string_view>
#include <vector>

namespace lumio {

using SettingKeys = std::vector<std::string_view>;

/// Reports each of the keys whose value in a settings file has changed. Called once the file is on disk.
void reportSettingChanges(const SettingKeys& keys, const adminhost::Dictionary& before,
                          const adminhost::Dictionary& after);
/// The same for a key whose values are secret.
void reportSecretChange(std::string_view key, const adminhost::Dictionary& before, const adminhost::Dictionary& after);

/// Reports one key of the configuration as not carried out. `words` are the tool's or the library's own text.
void reportSettingNotDone(std::string_view key, std::string reason, std::string words = {});
/// Reports each of the keys that the configuration holds.
void reportSettingsNotDone(const SettingKeys& keys, const adminhost::Dictionary& config, const std::string& reason,
                           const std::string& words);

}  // namespace lumio
