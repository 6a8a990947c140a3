#pragma once

// Directory records as the dictionaries that clients see.
//
// An entry has "shortName", "longName" (the short name if there is no full name), "guid", the same again as "_id_", and
// "type": "user" or "group". Keys for attributes that a record lacks are absent.

#include "platform/directory/Directory.h"
#include "platform/framework/Export.h"
#include "platform/value/Result.h"
#include "platform/value/Value.h"

#include <cstddef>
#include <string_view>

namespace adminhost {

[[nodiscard]] ADMINHOST_EXPORT Dictionary directoryEntryOf(const DirectoryRecord& record);

/// People and groups whose short or full name begins with the text, without regard to case. Returns entries, those
/// found by short name first, each record once, at most `limit` of them (0 is no limit). An empty text finds all.
/// Fails if the directory fails.
[[nodiscard]] ADMINHOST_EXPORT Result<Array> directoryEntries(std::string_view matchText, std::size_t limit);

/// People and groups whose short name or UUID is the text: entries that also have "node", the name of the node that
/// holds the record, and "kerberosPrincipal", the principal in the first Kerberos authority of a person who has one.
[[nodiscard]] ADMINHOST_EXPORT Result<Array> directoryEntriesOf(std::string_view nameOrUuid);

/// The groups of which the people with that short name or UUID are members, directly or through other groups, in the
/// node of the person: entries that also have "node". Each person's groups are searched for by the person, so large
/// groups are not read.
[[nodiscard]] ADMINHOST_EXPORT Result<Array> directoryGroupsOf(std::string_view nameOrUuid);

}  // namespace adminhost
