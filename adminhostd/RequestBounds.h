#pragma once

// What one client may ask of the daemon. The configuration can change each.

#include "adminhostd/RequestBody.h"

#include <chrono>
#include <cstddef>

namespace adminhost {

struct RequestBounds {
    std::size_t bodyBytes = std::size_t{8} << 20U;
    BodyBounds body;                                 ///< values and depth of a body
    std::size_t headBytes = std::size_t{32} << 10U;  ///< of a request's first line and headers
    std::size_t connections = 256;                   ///< in total
    std::chrono::seconds clientTimeout{30};          ///< for a whole request, and for reading each MiB of an answer
};

}  // namespace adminhost
