#pragma once

// The verbs that look back: what writes of settings changed, and going back.

#include "adminhostctl/Verb.h"

namespace adminhost::ctl {

/// The settings that differ, "KEY: BEFORE -> AFTER" each; only the given keys are compared, and secrets never.
[[nodiscard]] std::vector<std::string> changesBetween(const Dictionary& before, const Dictionary& after,
                                                      const std::vector<std::string>& keys);

[[nodiscard]] ExitStatus history(const Context& context, std::span<const std::string> arguments);
/// Writes the settings of an entry as every verb that changes something does it (Writing.h). A setting that is set now
/// and was not set then stays: it is named, and the status is failed. A secret stays too, with a note.
[[nodiscard]] ExitStatus rollback(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
