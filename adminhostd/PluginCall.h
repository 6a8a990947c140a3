#pragma once

// Calling a plug-in: no exception of a plug-in reaches the host.

#include "platform/value/Result.h"

#include <exception>
#include <type_traits>
#include <utility>

namespace adminhost {

template <class T>
struct ResultOf {
    using Type = Result<T>;
};
template <class T>
struct ResultOf<Result<T>> {
    using Type = Result<T>;
};

/// Calls a function that runs code of a plug-in, and returns its result. If it throws, returns an error with the
/// exception's text.
template <class Function>
[[nodiscard]] auto callPlugin(Function&& function) -> typename ResultOf<std::invoke_result_t<Function>>::Type {
    try {
        if constexpr (std::is_void_v<std::invoke_result_t<Function>>) {
            std::forward<Function>(function)();
            return {};
        } else {
            return std::forward<Function>(function)();
        }
    } catch (const std::exception& exception) {
        return failure({"plugin", 0, exception.what()});
    } catch (...) {
        return failure({"plugin", 0, "an exception of unknown type"});
    }
}

}  // namespace adminhost
