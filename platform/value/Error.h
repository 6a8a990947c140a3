#pragma once

// Error record: how an operation reports what went wrong.

#include "platform/framework/Export.h"

#include <cstdint>
#include <optional>
#include <string>

namespace adminhost {

struct ADMINHOST_EXPORT Error {
    std::string domain;
    std::int64_t code = 0;
    std::optional<std::string> description;

    friend bool operator==(const Error&, const Error&) = default;
};

}  // namespace adminhost
