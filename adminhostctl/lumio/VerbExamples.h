#pragma once

// Examples of the verbs of the desired state, which name settings and lists of this one service.

#include "adminhostctl/Verb.h"

#include <vector>

namespace adminhost::ctl {

/// Gives examples to the verbs that have none.
void addExamples(std::vector<Verb>& verbs);

}  // namespace adminhost::ctl
