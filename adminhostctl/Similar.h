#pragma once

// Suggestions for names that are not known.

#include <span>
#include <string>
#include <string_view>

namespace adminhost::ctl {

/// Returns "; did you mean \"X\"?" for the candidate that differs least from the word, by letters that are missing,
/// added, wrong or swapped, in any case; empty if all differ in more than a third of the word's letters (in one of a
/// short word).
[[nodiscard]] std::string didYouMean(std::string_view word, std::span<const std::string> candidates);

}  // namespace adminhost::ctl
