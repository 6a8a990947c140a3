#pragma once

// The daemon's directory of people and groups, by the names that a person types or a file lists.

#include "adminhostctl/Verb.h"
#include "platform/value/Value.h"

#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace adminhost::ctl {

/// The dictionaries of a list.
[[nodiscard]] std::vector<Dictionary> dictionariesOf(const Value& list);

/// The entries whose short or full name begins with the text, in any case: the first 50 of the directory.
[[nodiscard]] std::vector<Dictionary> entriesBeginning(const Context& context, const std::string& text);

/// The directory's entries with exactly this name or UUID. Throws Failure if the directory fails.
[[nodiscard]] std::vector<Dictionary> entriesNamed(const Context& context, const std::string& name);

/// "person" or "group": the word that messages have for a type of entry.
[[nodiscard]] std::string_view wordOfType(std::string_view type) noexcept;

/// The usage error for a name or UUID that the directory does not have ("person or group not found: ..."); suggests a
/// similar short name.
[[nodiscard]] Failure unknownName(const Context& context, std::string_view what, const std::string& name);

/// The usage error for a name that several entries have.
[[nodiscard]] Failure ambiguousName(const std::string& name, std::span<const Dictionary> entries);

}  // namespace adminhost::ctl
