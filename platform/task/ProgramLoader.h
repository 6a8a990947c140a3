#pragma once

#include "platform/files/Path.h"
#include "platform/framework/Export.h"

#include <optional>
#include <string>

namespace adminhost {

/// The dynamic loader that the kernel starts with a program, as its file names it; the empty text for a program that
/// needs none. Returns nullopt for anything else than a readable program of this machine's kind, such as a script.
[[nodiscard]] ADMINHOST_EXPORT std::optional<std::string> loaderOf(const DiskPath& program);

}  // namespace adminhost
