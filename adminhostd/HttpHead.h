#pragma once

// The head of a request: its headers, its target, and errors that the HTTP library accepts.

#include "adminhostd/Http.h"

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

[[nodiscard]] std::optional<std::string_view> headerOf(MHD_Connection* connection, const char* name);
[[nodiscard]] std::uint64_t announcedLength(MHD_Connection* connection);
/// The path of a request's target, which may be a whole address.
[[nodiscard]] std::string pathOf(std::string_view target);
/// Rejects errors in the head of a request that the library accepts, and a head above the bound.
[[nodiscard]] std::optional<HttpAnswer> headRefusal(MHD_Connection* connection, std::string_view version,
                                                    std::size_t bytesMaximum);
/// Decodes %XX in place. A decoded NUL would end the text, so that another address would be served than the client
/// asked for: "%00" stays as it was sent, like anything that is not a code.
std::size_t decodeEscapes(void*, MHD_Connection*, char* text);

}  // namespace adminhost
