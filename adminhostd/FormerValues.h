#pragma once

// Hides values of a plug-in's history that have become secret, while the operation is still running.

#include "platform/files/Path.h"
#include "platform/framework/Report.h"

#include <array>
#include <cstdint>
#include <map>
#include <optional>
#include <set>
#include <string>
#include <string_view>

namespace adminhost {

/// Hides kept values of resources when they become secret, while the operation is still running: its worker may be
/// killed before keepResources(). For one operation: entries that are added after the first call are not seen.
class FormerValues {
  public:
    explicit FormerValues(std::string_view plugin);

    /// Replaces the values of this part by "(secret)" in all entries. An entry that cannot be replaced is left as it
    /// is: keepResources() tries again and returns the error.
    void hide(const SecretPart& part);

  private:
    using Thing = std::array<std::string, 3>;  ///< section, identity, key

    HostPath _resources;
    std::optional<std::map<Thing, std::set<std::uint64_t>>> _plain;  ///< the entries that show a value of a thing
};

}  // namespace adminhost
