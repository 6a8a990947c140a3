#pragma once

// Strings tables: dictionaries of texts by key, written by people.
//
// Quoted-text form: entries KEY = VALUE ; or KEY ; (the value is then the key). Keys and values are texts in double or
// single quotes, or without quotes if they consist of letters, digits and _ $ / : . - alone. A value may also be a list
// (A, B), a dictionary {KEY = VALUE;} or data <0fb7 7753>. The whole table may be in braces. Comments are /* */ and //.
// Escapes: \a \b \f \n \r \t \v, up to three octal digits, \U or \u and four hexadecimal digits (two in a row for a
// character beyond U+FFFF), and a backslash before any other character for that character. An octal escape names the
// character U+0000 to U+00FF. Encodings: UTF-8 and UTF-16, with or without a byte-order mark.

#include "platform/framework/Export.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <string_view>

namespace adminhost {

constexpr std::size_t stringsTableMaximumSize = std::size_t{16} << 20U;  ///< bytes
constexpr int stringsTableMaximumDepth = 64;                             ///< nested lists and dictionaries

/// Parses a strings table in quoted-text form, or an XML or binary property list that is a dictionary. If a key occurs
/// twice, the last one counts. The error describes what is wrong and where (line and column from 1, counted in
/// characters). Rejected: the character NUL, invalid UTF-8 and UTF-16, sizes and depths above the maximum.
[[nodiscard]] ADMINHOST_EXPORT Result<Dictionary> parseStringsTable(std::string_view bytes);

}  // namespace adminhost
