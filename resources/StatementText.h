#pragma once

// Texts within statements. A statement contains its values unchanged between double quotes, so not every text fits, and
// the tool's error about a statement may quote the values.

#include <optional>
#include <string>
#include <string_view>

namespace lumio {

/// Returns why the text must not be put between double quotes in a statement on the properties table: a clause that
/// follows "the value". Null if it fits. The same bounds apply to clients' values, which are checked before any
/// operation.
[[nodiscard]] std::optional<std::string> whyUnfitForStatement(std::string_view text);

/// The message with "(secret)" in place of every piece of the secret in it: the whole text, and the parts in the tool's
/// excerpts of the statement. A secret of a few characters is only replaced where it is a word of its own.
[[nodiscard]] std::string withoutSecret(std::string_view message, std::string_view secret, std::string_view statement);

}  // namespace lumio
