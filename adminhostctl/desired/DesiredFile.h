#pragma once

// The desired state as a file: what "export" writes and "plan" and "apply" read. One form, TOML:
//
//     [remove_unlisted]
//     properties = false       # remove properties that are not listed here
//     access = false           # take people from access lists who are not listed here
//
//     [settings]
//     server_port = 8170
//
//     [properties.watermark]
//     value = "left"
//     protect = false
//
//     [cameras."Main hall"]    # or its UUID
//     access_control = true
//     users = ["anna"]
//     groups = ["lecturers"]
//
// What is not listed stays as it is. The switches stand in a table of their own because a property or a camera may have
// any name.

#include "adminhostctl/Description.h"
#include "adminhostctl/desired/Plan.h"
#include "adminhostctl/desired/State.h"

#include <string>
#include <string_view>

namespace adminhost::ctl {

/// The file of a state. Its plan on that state has no change. Settings are the writable ones of writeSettings. What the
/// file cannot carry (a protected value, one of several properties of a name) stands in it as a comment.
[[nodiscard]] std::string exportOf(const State& state, const Description& writeSettings);

/// Throws Failure(usage) with what is wrong, in which line and column, and what to do: broken TOML, an unknown table,
/// key or setting, a value of another type than its key and what is stored under it.
[[nodiscard]] Wanted parseDesired(std::string_view text, const std::string& from, const Description& writeSettings,
                                  const State& state);

}  // namespace adminhost::ctl
