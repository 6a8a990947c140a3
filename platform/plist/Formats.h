#pragma once

// The forms of a property list, one parser each. Shared by this room's sources only.

#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost::plist {

/// Each parses a whole list of its form; nothing, with the error, if it is none or has more values.
[[nodiscard]] std::optional<Value> parseXml(std::string_view bytes, Error& error, std::size_t valuesMaximum);
[[nodiscard]] std::optional<Value> parseBinary(std::string_view bytes, Error& error, std::size_t valuesMaximum);

/// The text of the error for more values; its code is set by whoever knows that it is this one.
[[nodiscard]] std::string tooManyValues(std::size_t valuesMaximum);

/// The record of everything that is wrong with a list's content: domain "propertyList", code 1.
[[nodiscard]] Error contentError(std::string description);

/// UTF-16 without byte-order mark as UTF-8. Stops at what is not well-formed (an unpaired surrogate, half a unit):
/// then end, the number of bytes read, is less than the size.
struct FromUtf16 {
    std::string text;
    std::size_t end = 0;
};
[[nodiscard]] FromUtf16 utf8OfUtf16(std::string_view bytes, bool bigEndian);

/// Base64 with padding, in one line.
[[nodiscard]] std::string base64Of(const Data& data);
/// The bytes of padded base64; XML white space anywhere. Nothing for anything else, also for bits set beyond the end.
[[nodiscard]] std::optional<Data> dataOfBase64(std::string_view text);

/// The calendar range a date's text can show: years 0000 to 9999.
[[nodiscard]] bool isWritableDate(Date date) noexcept;

}  // namespace adminhost::plist
