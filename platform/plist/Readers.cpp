#include "platform/plist/Readers.h"

#include <utility>

#include <fmt/format.h>

namespace adminhost::plist {
Error contentError(std::string description) {
    return Error{"propertyList", 1, std::move(description)};
}

std::string tooManyValues(std::size_t valuesMaximum) {
    return fmt::format("there are more than {} values", valuesMaximum);
}

}  // namespace adminhost::plist
