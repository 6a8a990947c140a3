#pragma once

// The parts of a client's request: its body, its preferred form and its conditions.

#include "platform/value/Value.h"

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include <tl/expected.hpp>

namespace adminhost {

struct BodyBounds {
    /// A small dictionary is ten bytes in a body and a kilobyte in memory, so a bound on bytes alone would not bound
    /// the memory.
    std::size_t values = 100'000;
    std::size_t depth = 512;  ///< nested lists and dictionaries; the readers allow no more than this
};

enum class BodyForm { json, propertyList };

/// The form that a Content-Type names; JSON for none. Returns nullopt for an unknown type or character set.
[[nodiscard]] std::optional<BodyForm> bodyFormOf(std::string_view contentType);

struct BodyProblem {
    enum class Kind { malformed, tooManyValues, tooDeep };
    Kind kind = Kind::malformed;  ///< malformed also: not a dictionary
    std::string text;             ///< with line and column where they are known
};

/// The request dictionary of a body; an empty one for an empty body.
[[nodiscard]] tl::expected<Dictionary, BodyProblem> requestOf(std::string_view body, BodyForm form,
                                                              const BodyBounds& bounds = {});

/// Returns true when an Accept header prefers a property list to JSON, by a higher weight or by naming it first.
[[nodiscard]] bool prefersPropertyList(std::string_view accept);

/// The revisions that an If-Match header lists; an empty list for "*". Returns nullopt if the header is malformed or
/// empty.
[[nodiscard]] std::optional<std::vector<std::string>> revisionsOf(std::string_view ifMatch);

/// The number in an argument of an address; 0 if the argument is empty, nullopt if it is not a decimal number.
[[nodiscard]] std::optional<std::uint64_t> numberOf(std::string_view argument);

/// The time that a Request-Deadline header allows: a whole number of seconds, at least 1. Returns nullopt if it is
/// malformed. A very long time is shortened, because no operation may run that long.
[[nodiscard]] std::optional<std::chrono::seconds> deadlineOf(std::string_view requestDeadline);

}  // namespace adminhost
