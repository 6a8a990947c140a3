#pragma once

// Bounds for what a server may send for one search, all its pages together: it must not fill the worker's memory. Only
// tests change them: they need neither a million entries nor 256 MiB.

#include "platform/framework/Export.h"

#include <cstddef>

namespace adminhost {

struct LdapSearchBounds {
    std::size_t entries = 1'000'000;
    std::size_t bytes = std::size_t{256} << 20U;
};

/// For searches that begin from now on.
ADMINHOST_EXPORT void setLdapSearchBounds(const LdapSearchBounds& bounds) noexcept;

}  // namespace adminhost
