#pragma once

// Message digests.

#include "platform/framework/Export.h"

#include <string>
#include <string_view>

namespace adminhost {

/// The SHA-256 digest (FIPS 180-4) of the bytes, as 64 lower-case hexadecimal digits. Throws std::runtime_error if the
/// cryptography library fails.
[[nodiscard]] ADMINHOST_EXPORT std::string sha256Of(std::string_view bytes);
/// The same with a key (HMAC, FIPS 198-1): without the key, guesses of the bytes cannot be checked against the digest.
[[nodiscard]] ADMINHOST_EXPORT std::string keyedDigestOf(std::string_view key, std::string_view bytes);

}  // namespace adminhost
