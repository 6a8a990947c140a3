#pragma once

// "account create": the service's grid account.

#include "adminhostctl/Verb.h"

#include <span>
#include <string>
#include <string_view>

namespace adminhost::ctl {

inline constexpr std::string_view saveOption = "--save";

/// Creates the account in the directory node (the first argument) as its administrator (the second), then checks which
/// steps are left until the grid accepts it, and names the first one. With the option --save, writes its name and
/// password into the settings and shows neither in a file nor on the terminal.
[[nodiscard]] ExitStatus accountCreate(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
