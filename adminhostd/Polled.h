#pragma once

#include <algorithm>
#include <span>

#include <poll.h>

namespace adminhost {

/// Returns true if the descriptor is among the entries of a poll and was ready.
[[nodiscard]] inline bool isReady(std::span<const pollfd> polled, int descriptor) noexcept {
    return std::any_of(polled.begin(), polled.end(),
                       [&](const pollfd& entry) { return entry.fd == descriptor && entry.revents != 0; });
}

}  // namespace adminhost
