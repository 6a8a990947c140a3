#pragma once

// Texts within statements. A statement carries its values verbatim between double quotes, so not every text fits, and
// what the tool says about a statement may quote the values.

#include <optional>
#include <string>
#include <string_view>

namespace lumio {

/// Why the text must not be put between double quotes in a statement on the properties table: a clause that follows
/// "the value". Null if it fits. The same bounds hold for clients' values, which are checked before any operation.
[[nodiscard]] std::optional<std::string> whyUnfitForStatement(std::string_view text);

/// The message with every piece of the secret that it shows written as "(secret)": the whole text, and what the tool's
/// excerpts of the statement hold of it. A secret of a few characters is only replaced where it is a word of its own.
[[nodiscard]] std::string withoutSecret(std::string_view message, std::string_view secret, std::string_view statement);

}  // namespace lumio
