#pragma once

// Texts as a terminal shows them: control characters and widths.

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

/// Returns the text with the characters that a terminal would act on written as \xNN or \uNNNN: control characters,
/// also those above U+007F, and characters that change the direction of writing. Line feeds and tabs stay.
[[nodiscard]] std::string shown(std::string_view text);

/// shown(), with each further line indented by so many blanks: no line feed of a value begins a line of ours.
[[nodiscard]] std::string shownIndented(std::string_view text, std::size_t indent);

/// JSON text with the same characters written as \uNNNN. Its value stays the same: such characters occur only within
/// strings.
[[nodiscard]] std::string shownJson(std::string_view json);
/// XML text with the same characters written as &#xNN;
[[nodiscard]] std::string shownXml(std::string_view xml);

/// Number of columns of the text: wide characters have two, combining ones none. For texts without control characters.
[[nodiscard]] std::size_t widthOf(std::string_view text);

/// The text in lines of at most `width` columns (at least 2), broken at blanks if it has any.
[[nodiscard]] std::vector<std::string> wrapped(std::string_view text, std::size_t width);

/// Where a text beside a name goes.
struct TextPlace {
    std::size_t column;  ///< where it begins
    std::size_t below;   ///< where it begins, below the name, if fewer than 20 columns are left beside it
    std::size_t width;   ///< of the terminal
};

/// A name and its text in lines of at most `width` columns, each with a line feed.
[[nodiscard]] std::string beside(std::string_view name, std::string_view text, const TextPlace& place);

}  // namespace adminhost::ctl
