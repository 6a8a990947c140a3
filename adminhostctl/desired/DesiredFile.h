#pragma once

// The TOML file of a desired state, which "export" writes and "plan" and "apply" read. The tables are the sections that
// the descriptions name (StateForm.h):
//
//     [remove_unlisted]
//     SWITCH = false           # remove what is not listed here
//
//     [SETTINGS]
//     KEY = 8170
//
//     [SECTION."Main hall"]    # label, or identity if people may use it; identity only where labels are localized
//     FIELD = true
//     PEOPLE = ["anna"]
//
// Anything not listed stays as it is. The switches have a table of their own because an element may have any name.

#include "adminhostctl/desired/Plan.h"
#include "adminhostctl/desired/State.h"

#include <string>
#include <string_view>

namespace adminhost::ctl {

/// Returns the file of a state. Its plan for that state has no change. A value that the file cannot carry (a secret, an
/// element whose name is not unique) is a comment. Throws Failure(failed) when the service did not list a section:
/// without it, the file would look as if all of its elements had been removed.
[[nodiscard]] std::string exportOf(const StateForm& form, const State& state);

/// Reads a file. Throws Failure(usage) with the mistake, its line and column, and what to do: broken TOML, an unknown
/// table, key or setting, a value whose type is neither that of its key nor that of the stored value, or, unless
/// `force`, a value outside its range that is not stored yet.
[[nodiscard]] Wanted parseDesired(std::string_view text, const std::string& from, const StateForm& form,
                                  const State& state, bool force = false);

}  // namespace adminhost::ctl
