#pragma once

// Reading the audit back from the journal.
//
// Any account can write entries with any fields into the journal. Only entries whose trusted fields, which the journal
// itself adds, name the front's account and unit are returned.

#include "adminhostd/Protocol.h"

#include <cstddef>
#include <string>

#include <sys/types.h>

namespace adminhost {

constexpr std::size_t auditPageMaximum = 200;                         ///< entries of one answer
constexpr std::size_t auditPageBytesMaximum = std::size_t{1} << 20U;  ///< of their fields, roughly

/// The answer to a request for a page of the audit, oldest entries first. `account` is the front's, `unit` the unit
/// that the daemon runs in; empty if it runs in none: then entries of any unit count. The error is AUDIT_NOT_READABLE
/// if the journal does not run or cannot be read.
[[nodiscard]] protocol::Answer auditAnswer(const protocol::ReadAudit& order, uid_t account, const std::string& unit);

}  // namespace adminhost
