#pragma once

// Answers of the worker to the front.

#include "adminhostd/Protocol.h"
#include "adminhostd/RequestBody.h"
#include "platform/value/Value.h"

#include <string>
#include <string_view>

namespace adminhost {

/// The worker could not do it.
[[nodiscard]] protocol::Answer broken(std::string message);

/// The answer's text in the form that the client prefers; in JSON if a property list cannot carry it.
[[nodiscard]] protocol::Answer written(protocol::Outcome outcome, const Value& response, BodyForm form);

[[nodiscard]] protocol::Answer errorAnswer(std::string_view code, std::string_view message, BodyForm form);

}  // namespace adminhost
