#pragma once

// Property-list files: parsed strictly, written whole, atomically and durably.
//
// The XML form: one value in a <plist> element, version 1.0 (or none stated); a leading document type declaration
// without internal subset is skipped on reading and none is written. Dates are UTC ("2026-01-31T08:00:00Z"), integers
// decimal, data base64 with padding; white space may surround a number, a date or data. Encodings: UTF-8, UTF-16,
// US-ASCII and ISO-8859-1, as the declaration says. The binary form ("bplist00") is recognised by its first bytes; it
// is read, never written, and the fraction of a second of its dates is dropped.

#include "platform/files/Path.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

namespace adminhost {

constexpr std::size_t plistMaximumSize = std::size_t{64} << 20U;  ///< bytes
constexpr int plistMaximumDepth = 512;                            ///< nested arrays and dictionaries
constexpr std::int64_t plistTooManyValues = 2;  ///< code of the error for more values than the caller allows

/// Parses a property list of at most so many values (keys are not counted). The error describes what is wrong and where
/// (line and column from 1; in the binary form the byte from 0), in the domain "propertyList", code 1 or
/// plistTooManyValues. Rejected: invalid UTF-8, a key without a value, a key that
/// occurs twice, unknown elements and attributes, text after the end, a second root, a document type with an internal
/// subset, integers outside -2^63 ... 2^64-1, dates that the calendar does not have, more than the maximum size or
/// depth. In the binary form also: objects inside themselves, object identifiers, null, and more content than the
/// maximum size, however often an object is referred to.
[[nodiscard]] ADMINHOST_EXPORT Result<Value> parsePropertyList(std::string_view bytes,
                                                               std::size_t valuesMaximum = SIZE_MAX);

/// The XML form. Fails if a value cannot be written: null, a string or key with a NUL or
/// another character that XML 1.0 does not allow, invalid UTF-8, a date outside the years 0000 to 9999, too deep, or
/// more than the maximum size. The error names the value by its key path.
[[nodiscard]] ADMINHOST_EXPORT Result<std::string> xmlPropertyList(const Value& value);

/// Reads and parses a whole file (64 MiB at most, regular files or links to one only). The error is readFile()'s or
/// parsePropertyList()'s, with the path in front.
[[nodiscard]] ADMINHOST_EXPORT Result<Value> readPropertyList(const DiskPath& path);

/// Replaces the file by the XML form of the value, atomically and durably: see replaceFile() in
/// platform/files/ReplaceFile.h for what is kept of the old file and what happens on failure. A value that cannot be
/// serialised changes nothing.
[[nodiscard]] ADMINHOST_EXPORT Result<void> writePropertyList(const Value& value, const HostPath& path);

}  // namespace adminhost
