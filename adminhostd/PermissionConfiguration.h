#pragma once

#include "adminhostd/ConfigurationEntry.h"
#include "adminhostd/Permissions.h"

#include <vector>

namespace adminhost {

/// Reads the list of tables [[permission]]. Throws like ConfigurationEntry.
void readPermissions(const ConfigurationEntry& entry, std::vector<PermissionOptions>& permissions);

}  // namespace adminhost
