#include "adminhostctl/Similar.h"

#include <algorithm>
#include <cctype>
#include <vector>

namespace adminhost::ctl {
namespace {

constexpr std::size_t longestWord = 200;  ///< a longer one is no typo of anything, and the comparison is quadratic

char lower(char c) {
    return static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
}

/// How many letters have to be added, removed, replaced or swapped with their neighbour to turn one text into the other
/// (the restricted Damerau-Levenshtein distance).
std::size_t distance(std::string_view a, std::string_view b) {
    std::vector<std::size_t> before(b.size() + 1);
    std::vector<std::size_t> above(b.size() + 1);
    std::vector<std::size_t> row(b.size() + 1);
    for (std::size_t j = 0; j <= b.size(); ++j) {
        above[j] = j;
    }
    for (std::size_t i = 1; i <= a.size(); ++i) {
        row[0] = i;
        for (std::size_t j = 1; j <= b.size(); ++j) {
            const bool same = lower(a[i - 1]) == lower(b[j - 1]);
            row[j] = std::min({above[j] + 1, row[j - 1] + 1, above[j - 1] + (same ? 0U : 1U)});
            if (i > 1 && j > 1 && lower(a[i - 1]) == lower(b[j - 2]) && lower(a[i - 2]) == lower(b[j - 1])) {
                row[j] = std::min(row[j], before[j - 2] + 1);
            }
        }
        before = above;
        above = row;
    }
    return above[b.size()];
}

}  // namespace

std::string didYouMean(std::string_view word, std::span<const std::string> candidates) {
    if (word.empty() || word.size() > longestWord) {
        return {};
    }
    const std::string* best = nullptr;
    std::size_t least = std::max<std::size_t>(1, word.size() / 3) + 1;
    for (const std::string& candidate : candidates) {
        const std::size_t longer = std::max(candidate.size(), word.size());
        if (longer - std::min(candidate.size(), word.size()) >= least) {
            continue;
        }
        if (const std::size_t differs = distance(word, candidate); differs < least) {
            least = differs;
            best = &candidate;
        }
    }
    return best == nullptr ? std::string() : "; did you mean \"" + *best + "\"?";
}

}  // namespace adminhost::ctl
