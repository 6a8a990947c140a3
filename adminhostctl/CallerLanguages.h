#pragma once

// The languages of the person at the command line.

#include <optional>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

/// The languages that the environment asks for, by the rules of gettext: LANGUAGE, unless the locale (the first of
/// LC_ALL, LC_MESSAGES and LANG that is set) is "C" or "POSIX"; else the locale's. Empty if it asks for none, which
/// means English. nullopt if none of the variables is set: then the daemon's languages are used.
[[nodiscard]] std::optional<std::vector<std::string>> callerLanguages();

/// The languages of an option's text, "de,fr".
[[nodiscard]] std::vector<std::string> languagesOfText(std::string_view text);

}  // namespace adminhost::ctl
