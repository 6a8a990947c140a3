#pragma once

// What a client sends with a request: its body and its conditions.

#include "platform/value/Value.h"

#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

enum class BodyForm { json, propertyList };

/// The form that a Content-Type names; JSON for none. Nothing for a type or a character set that is not understood.
[[nodiscard]] std::optional<BodyForm> bodyFormOf(std::string_view contentType);

/// The request dictionary of a body; an empty one for an empty body. Nothing, with the problem and its line and column,
/// when the body is malformed or no dictionary.
[[nodiscard]] std::optional<Dictionary> requestOf(std::string_view body, BodyForm form, std::string& problem);

/// The revisions that an If-Match header names; empty for none and for "*". Nothing when it is malformed.
[[nodiscard]] std::optional<Array> revisionsOf(std::string_view ifMatch);

}  // namespace adminhost
