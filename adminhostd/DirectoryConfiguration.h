#pragma once

// The directory's part of the configuration file: the table [directory] with its nodes.

#include "adminhostd/ConfigurationEntry.h"
#include "adminhostd/DirectoryOptions.h"

namespace adminhost {

/// Applies the value of the key "directory". Throws std::runtime_error with the file, the line, the column and what is
/// wrong. DNs and the form of URIs are left to checkLdapNodeSettings(), which the worker calls.
void readDirectory(const ConfigurationEntry& directory, DirectoryOptions& options);

}  // namespace adminhost
