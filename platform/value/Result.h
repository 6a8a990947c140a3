#pragma once

// A value, or the error that explains why there is none.

#include "platform/value/Error.h"

#include <utility>

#include <tl/expected.hpp>

namespace adminhost {

template <class T>
using Result = tl::expected<T, Error>;

/// `return failure(error);` from a function that returns a Result.
[[nodiscard]] inline tl::unexpected<Error> failure(Error error) {
    return tl::unexpected<Error>(std::move(error));
}

}  // namespace adminhost
