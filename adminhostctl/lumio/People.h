#pragma once

// People and groups of the directory, by the names that a person types.

#include "adminhostctl/DirectoryNames.h"

#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

/// The option with which names are names of groups.
inline constexpr std::string_view groupOption = "--group";

/// The short names of the people, or of the groups, with these names or UUIDs. Throws Failure(usage) for a name that
/// the directory does not have, that several have, or that is of the other kind, so that nothing is sent for the
/// others.
[[nodiscard]] std::vector<std::string> shortNamesOf(const Context& context, std::span<const std::string> names,
                                                    bool groups);

/// Whether both are the same UUID, in any case.
[[nodiscard]] bool isSameUuid(std::string_view a, std::string_view b);

}  // namespace adminhost::ctl
