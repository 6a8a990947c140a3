#pragma once

// What a person or a group may use.

#include "adminhostctl/Verb.h"

#include <span>
#include <string>

namespace adminhost::ctl {

inline constexpr std::string_view revokeOption = "--revoke";

/// Prints the cameras and workflows, disabled ones included, that a person or group may use: those that are open to
/// everyone, and those whose list has the person or one of the person's groups, direct or nested. The name is a short
/// name or a UUID, also one that the directory does not know any more but that lists still have; with --group it names
/// a group, else a person if there is one. With --revoke, prints the entries of the person or group itself, removes
/// them from all lists and compares afterwards. Throws Failure if the directory or a list cannot be read, because a
/// part of it would look as if there were no access.
[[nodiscard]] ExitStatus accessOf(const Context& context, std::span<const std::string> arguments);

/// Removes an account that the directory does not know from the list of one element (its UUID), or from all lists
/// without one, and prints the changes. Throws Failure(usage) if no list has the UUID.
[[nodiscard]] ExitStatus removeUnknown(const Context& context, const std::string& uuid,
                                       const std::string& element = {});

/// Whether a list that the service returns has this UUID, of an account that the directory does not know.
[[nodiscard]] bool isUnknownEntry(const Context& context, const std::string& uuid, const std::string& element = {});

}  // namespace adminhost::ctl
