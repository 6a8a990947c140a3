#pragma once

// The answers of the front: errors with their codes, and how a request ended in the worker.

#include "adminhostd/Http.h"
#include "adminhostd/OperationQueue.h"

#include <string_view>

namespace adminhost {

[[nodiscard]] HttpAnswer errorAnswer(unsigned status, std::string_view code, std::string_view message);
/// 503, with the header that states when to try again.
[[nodiscard]] HttpAnswer retryLater(std::string_view code, std::string_view message);
/// The code of an error that comes from the front itself.
[[nodiscard]] std::string_view codeOf(const HttpAnswer& answer);
/// Moves the bytes out of the worker's answer.
[[nodiscard]] HttpAnswer answerFor(protocol::Answer& answer);
[[nodiscard]] HttpAnswer answerFor(const Unserved& unserved);
[[nodiscard]] HttpAnswer unknownRequest(std::string_view id);

}  // namespace adminhost
