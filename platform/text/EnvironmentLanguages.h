#pragma once

// The languages that the environment asks for.

#include "platform/framework/Export.h"

#include <string>
#include <vector>

namespace adminhost {

/// The languages of the first of LANGUAGE (a list with colons), LC_ALL, LC_MESSAGES and LANG that is not empty, the
/// preferred one first, without their encodings ("de_DE.UTF-8@euro" is "de_DE@euro"). "C" and "POSIX" are not
/// languages.
[[nodiscard]] ADMINHOST_EXPORT std::vector<std::string> languagesOfEnvironment();

}  // namespace adminhost
