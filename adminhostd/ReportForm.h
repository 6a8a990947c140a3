#pragma once

// Reports as dictionaries: the form that clients, the audit and the notes about changes share (docs/http.md).

#include "platform/framework/Report.h"
#include "platform/value/Value.h"

namespace adminhost {

[[nodiscard]] Dictionary reportOf(const Change& change);
[[nodiscard]] Dictionary reportOf(const NotDone& part);
/// The change of a dictionary. What is missing or of another type is empty.
[[nodiscard]] Change changeOf(const Dictionary& report);
[[nodiscard]] NotDone notDoneOf(const Dictionary& report);

}  // namespace adminhost
