#pragma once

// Search filters in the form of RFC 4515.

#include <span>
#include <string>
#include <string_view>

namespace adminhost {

/// Returns true if the library can read the filter.
[[nodiscard]] bool isLdapFilter(const std::string& filter);

/// "(ATTRIBUTE=VALUE)" with the value escaped, so that it can hold any bytes.
[[nodiscard]] std::string filterEqual(std::string_view attribute, std::string_view value);
/// "(ATTRIBUTE=VALUE*)"; for an empty value, entries that have the attribute.
[[nodiscard]] std::string filterBeginning(std::string_view attribute, std::string_view value);

/// Any or all of the filters. One filter is returned as it is; of none, any is false and all is true.
[[nodiscard]] std::string filterAny(std::span<const std::string> filters);
[[nodiscard]] std::string filterAll(std::span<const std::string> filters);

}  // namespace adminhost
