#pragma once

// The account that the tests add to the machine's for themselves.

#include <string>

#include <sys/types.h>

namespace accounts {

constexpr uid_t user = 4711;
constexpr gid_t group = 4712;
constexpr gid_t further = 4713;  ///< a group of which the account is a member
constexpr uid_t stranger = 4714;

/// Its home directory.
inline std::string& home() {
    static std::string path;
    return path;
}

}  // namespace accounts
