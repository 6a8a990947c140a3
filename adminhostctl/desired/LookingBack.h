#pragma once

// The verbs of the history: list what writes changed, and restore former settings.

#include "adminhostctl/Verb.h"

namespace adminhost::ctl {

/// The numbers of all entries of the daemon's history, the newest first: the completion of rollback.
[[nodiscard]] std::vector<std::string> historyNumbersOf(const Context& context);

/// Prints the entries of the daemon's history, one row for each write and each edit outside the daemon. The other
/// formats hold them as a list, oldest first: as the daemon returns them, changes of settings first, then those of
/// elements (with "section"); the number of an entry without settings begins with "r". Elements that the daemon has
/// recorded by their identity only have their present names, if the service can be asked for them.
[[nodiscard]] ExitStatus history(const Context& context, std::span<const std::string> arguments);
/// Writes the settings of an entry, in the same way as every verb that changes something (Writing.h). A setting that is
/// set now and was not set then keeps its value: it is named, and the status is failed. A secret also keeps its value,
/// with a note.
[[nodiscard]] ExitStatus rollback(const Context& context, std::span<const std::string> arguments);

}  // namespace adminhost::ctl
