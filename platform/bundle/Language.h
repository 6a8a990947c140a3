#pragma once

// Names and codes of languages, and which of a bundle's localizations suit a person.

#include "platform/framework/Export.h"

#include <string>
#include <string_view>
#include <vector>

namespace adminhost {

/// Returns true for an English name of a language ("French", "Simplified Chinese"; in upper or lower case, with "_" or
/// "-" for a blank) and for a code ("fr", "pt_BR", "zh-Hant", also as the C library writes it: "de_DE.UTF-8",
/// "fr@euro").
[[nodiscard]] ADMINHOST_EXPORT bool isLanguage(std::string_view nameOrCode);

/// The localizations that suit the preferred languages, best first, each at most once. For every preferred language in
/// its order: the one spelled the same; those of the same language, script and region under another spelling ("English"
/// and "en"; missing parts are filled in with the likely ones: "zh-TW" is "zh-Hant"); the language without a region;
/// the language of another region. Never another language, and never another script of the same language.
[[nodiscard]] ADMINHOST_EXPORT std::vector<std::string> matchingLocalizations(
    const std::vector<std::string>& localizations, const std::vector<std::string>& preferredLanguages);

/// The localizations that are the named one under any spelling, the exact spelling first.
[[nodiscard]] ADMINHOST_EXPORT std::vector<std::string> equivalentLocalizations(
    const std::vector<std::string>& localizations, std::string_view nameOrCode);

}  // namespace adminhost
