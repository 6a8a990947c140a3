#pragma once

// Property-list files: parsed strictly, written whole, atomically and durably.
//
// Format of the XML form: the property-list document type, version 1.0; a leading document type declaration without
// internal subset is skipped on reading and none is written. Dates are UTC ("2026-01-31T08:00:00Z").

#include "platform/files/Path.h"
#include "platform/value/Error.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace adminhost {

constexpr std::size_t plistMaximumSize = std::size_t{64} << 20U;  ///< bytes
constexpr int plistMaximumDepth = 512;                            ///< nested arrays and dictionaries

/// Parses a property list. Nothing on failure; then, if error is given, it says what is wrong and where (line and column from 1).
/// Refused: invalid UTF-8, a key without a value, unknown elements, text after the end, a second root, a document type
/// with an internal subset, integers outside -2^63 ... 2^64-1, more than the maximum size or depth.
[[nodiscard]] std::optional<Value> parsePropertyList(std::string_view bytes, Error* error = nullptr);

/// The XML form. Nothing, with the error, when a value cannot be carried: null, a string or key with a NUL or another
/// character that XML 1.0 does not allow, invalid UTF-8, too deep.
[[nodiscard]] std::optional<std::string> xmlPropertyList(const Value& value, Error* error = nullptr);

/// Reads and parses a whole file (64 MiB at most, regular files only). Nothing if it cannot be read or parsed.
[[nodiscard]] std::optional<Value> readPropertyList(const DiskPath& path, Error* error = nullptr);

/// Replaces the file: temporary file in the same directory, owner, mode, access control list and extended attributes
/// of the old file kept (a new file is 0644), fsync, rename, fsync of the directory. On failure the old file stands
/// untouched, no temporary file is left, and the error names the step, the host path and the system's text.
[[nodiscard]] std::optional<Error> writePropertyList(const Value& value, const HostPath& path);

}  // namespace adminhost
