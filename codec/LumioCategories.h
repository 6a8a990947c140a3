#pragma once

// Base64 with the rules of protected values, and a dictionary operation.
//
// The codec is the service's own and deliberately not a standard one: the decoder works line by line, copies lines that
// are not base64 through unchanged, and reads every byte as its low 7 bits (0xC1 is an "A", 0x8A a line feed, 0xA0 a
// blank, 0xBD a pad). Every operation returns new bytes and none reports a failure.

#include "platform/value/Value.h"

#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

namespace lumio {

using Bytes = std::span<const std::uint8_t>;

/// Base64 text with a line feed after every 76 characters, the last full line included.
[[nodiscard]] adminhost::Data LumioUtilities_encodeBase64(Bytes data);
/// Base64 text on one line.
[[nodiscard]] adminhost::Data LumioUtilities_encodeBase64WithoutLineBreaks(Bytes data);
/// LumioUtilities_encodeBase64 as a string.
[[nodiscard]] std::string base64EncodedString(Bytes data);

/// The bytes of every line that is base64, the raw bytes and line end of every other line.
[[nodiscard]] adminhost::Data LumioUtilities_decodeBase64(Bytes text);
/// LumioUtilities_decodeBase64 of the string's bytes.
[[nodiscard]] adminhost::Data base64DecodedData(std::string_view text);

/// The strict test: characters of the alphabet alone, then at most two "=", a multiple of 4 in all; no line ends, no
/// blanks. Empty data passes.
[[nodiscard]] bool LumioUtilities_isValidBase64Data(Bytes data);

/// The entries of the dictionary for the keys, in the keys' order; missing keys are left out. Returns nullopt for null
/// keys.
[[nodiscard]] std::optional<adminhost::Dictionary> objectsWithAndForKeys(const adminhost::Dictionary& dictionary,
                                                                         const std::vector<std::string>* keys);

}  // namespace lumio
