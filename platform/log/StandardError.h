#pragma once

#include "platform/framework/Export.h"
#include "platform/log/QueuedSink.h"

#include <string_view>

namespace adminhost {

/// Writes to standard error without blocking, whatever it is: a file, a terminal, a pipe that nobody reads, or a
/// socket. Its flags are left alone, because other processes share them.
[[nodiscard]] ADMINHOST_EXPORT QueuedSink::Written writeToStandardError(std::string_view text);

/// Returns true if a service manager has connected the present standard error to the journal ($JOURNAL_STREAM).
[[nodiscard]] ADMINHOST_EXPORT bool standardErrorIsTheJournal();

}  // namespace adminhost
