#pragma once

// "help": the verbs, one of them with its options and examples, or a command of the service.

#include "adminhostctl/Verb.h"

#include <span>
#include <string>

namespace adminhost::ctl {

/// Prints the list of verbs; with the words of a verb, or the first of them, its arguments, options and examples; with
/// a command, its keys with types and units, its answer and an example. Only commands need the daemon.
[[nodiscard]] ExitStatus help(const Context& context, std::span<const std::string> arguments);

/// The key's type for people: "whole number".
[[nodiscard]] std::string typeText(const DescribedKey& key);

/// The options that every verb and every command has.
[[nodiscard]] std::span<const VerbOption> commonOptions() noexcept;

}  // namespace adminhost::ctl
