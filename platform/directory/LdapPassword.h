#pragma once

// The password with which a node signs in to its server, read anew at each connect.

#include "platform/directory/LdapNode.h"
#include "platform/value/Result.h"

#include <string>

namespace adminhost {

/// The caller wipes it after use. Fails if the file cannot be read, is accessible to group or others, or holds no
/// password.
[[nodiscard]] Result<std::string> ldapBindPassword(const LdapNodeSettings& settings);

}  // namespace adminhost
