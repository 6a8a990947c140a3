#pragma once

// The plug-in's own descriptions of its commands, in the form that the command line gets.

#include "adminhostctl/Description.h"
#include "commands/CommandTable.h"

#include <string_view>

namespace adminhost::ctl {

inline Description describe(std::string_view name) {
    const Value all = lumio::describeCommands();
    for (const Value& command : *all.array()) {
        if (command.dictionary()->get("name") == Value(name)) {
            return Description(*command.dictionary());
        }
    }
    return {};
}

}  // namespace adminhost::ctl
