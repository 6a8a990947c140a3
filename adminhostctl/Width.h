#pragma once

// Texts as they stand on a terminal.

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

/// The text with everything that a terminal would act on shown instead: control characters as \xNN, also those above
/// U+007F and those that change the direction of writing. Line feeds stay.
[[nodiscard]] std::string shown(std::string_view text);

/// JSON text with the same characters written as \uNNNN. Both lose nothing: such characters stand only within strings.
[[nodiscard]] std::string shownJson(std::string_view json);
/// XML text with the same characters written as &#xNN;
[[nodiscard]] std::string shownXml(std::string_view xml);

/// Columns that the text takes: wide characters two, combining ones none. For texts without control characters.
[[nodiscard]] std::size_t widthOf(std::string_view text);

/// The text in lines of at most so many columns (at least 2), broken at blanks where it has any.
[[nodiscard]] std::vector<std::string> wrapped(std::string_view text, std::size_t width);

}  // namespace adminhost::ctl
