#pragma once

// "complete", the hidden verb that the completions of all shells call.

#include "adminhostctl/Verb.h"

#include <chrono>
#include <optional>
#include <span>
#include <string>
#include <vector>

namespace adminhost::ctl {

/// The options on the command line that is being completed which say what daemon to ask, and how.
struct CompletionTarget {
    std::optional<std::string> host;
    std::optional<std::string> socket;
    std::optional<std::string> languages;
    std::optional<std::string> timeout;
};

/// Finds them in the words after "complete".
[[nodiscard]] CompletionTarget completionTarget(std::span<const std::string> words);

/// Prints what can stand in place of the last of the words, which follow the program's name on the command line that is
/// being completed; one candidate a line. Each begins with that word. What has to be asked of the daemon is left out if
/// it fails or takes longer than the limit: the process then ends at once, with exit status 0.
[[nodiscard]] ExitStatus complete(const Context& context, std::span<const std::string> words,
                                  std::chrono::milliseconds limit);

/// The values that the key has; empty if it may have any.
[[nodiscard]] std::vector<std::string> valuesOf(const DescribedKey& key);

/// The dictionaries in the list at the key of an answer.
[[nodiscard]] std::vector<Dictionary> dictionariesAt(const Value& answer, std::string_view list);

/// Texts of a key of the dictionaries in the list at the key of an answer.
[[nodiscard]] std::vector<std::string> textsOf(const Value& answer, std::string_view list, std::string_view key);

/// Short names of people and groups that begin with the typed word: a completion of a verb whose arguments are names
/// (Verb::complete). The daemon returns 50 at most.
[[nodiscard]] std::vector<std::string> peopleNames(const Context& context, const TypedArguments& typed);

}  // namespace adminhost::ctl
