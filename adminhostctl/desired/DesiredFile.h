#pragma once

// The desired state as a file: what "export" writes and "plan" and "apply" read. One form, TOML. The tables are the
// sections that the descriptions name (StateForm.h):
//
//     [remove_unlisted]
//     SWITCH = false           # remove what is not listed here
//
//     [SETTINGS]
//     KEY = 8170
//
//     [SECTION."Main hall"]    # label, or identity where people may use it
//     FIELD = true
//     PEOPLE = ["anna"]
//
// What is not listed stays as it is. The switches have a table of their own because an element may have any name.

#include "adminhostctl/desired/Plan.h"
#include "adminhostctl/desired/State.h"

#include <string>
#include <string_view>

namespace adminhost::ctl {

/// The file of a state. Its plan on that state has no change. What the file cannot carry (a secret, one of several
/// elements of a name) is a comment. Throws Failure(failed) when the service did not list a section: the file
/// would read as if all of its elements were gone.
[[nodiscard]] std::string exportOf(const StateForm& form, const State& state);

/// Throws Failure(usage) with what is wrong, in which line and column, and what to do: broken TOML, an unknown table,
/// key or setting, a value of another type than its key and what is stored under it.
[[nodiscard]] Wanted parseDesired(std::string_view text, const std::string& from, const StateForm& form,
                                  const State& state);

}  // namespace adminhost::ctl
