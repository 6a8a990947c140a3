#pragma once

// Where in a text something is, as messages name it.

#include "platform/framework/Export.h"

#include <string>
#include <string_view>

namespace adminhost {

/// "line L, column C" of the character that follows the text, both from 1; columns count characters.
[[nodiscard]] ADMINHOST_EXPORT std::string lineAndColumnAfter(std::string_view text);

}  // namespace adminhost
