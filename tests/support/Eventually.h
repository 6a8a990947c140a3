#pragma once

#include <chrono>
#include <functional>
#include <thread>

namespace adminhost::test {

/// Returns true once the condition is true, false if it is still false after that time.
inline bool eventually(const std::function<bool()>& condition,
                       std::chrono::steady_clock::duration patience = std::chrono::seconds(10)) {
    const auto end = std::chrono::steady_clock::now() + patience;
    while (!condition()) {
        if (std::chrono::steady_clock::now() >= end) {
            return false;
        }
        std::this_thread::sleep_for(std::chrono::milliseconds(5));
    }
    return true;
}

}  // namespace adminhost::test
