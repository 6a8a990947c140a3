#pragma once

// Searches files and processes for a test's password, which must be in none of them.

#include <array>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include <sys/types.h>

namespace adminhost::test {

constexpr const char* planted = "planted-grid-secret-7261";
/// As it is, in base64 and in hexadecimal digits.
constexpr std::array<std::string_view, 3> plantedForms{planted, "cGxhbnRlZC1ncmlkLXNlY3JldC03MjYx",
                                                       "706c616e7465642d677269642d7365637265742d37323631"};

[[nodiscard]] bool holdsPlanted(const std::string& bytes);

struct FileSearch {
    std::size_t files = 0;             ///< regular files that were read, names of links aside
    std::vector<std::string> holding;  ///< paths of those whose bytes or name hold it
};

[[nodiscard]] FileSearch searchBelow(const std::filesystem::path& directory);

/// The process and all its descendants at this moment.
[[nodiscard]] std::vector<pid_t> processesFrom(pid_t first);

/// The argument list and environment of a process.
[[nodiscard]] std::string argumentsAndEnvironmentOf(pid_t pid);

}  // namespace adminhost::test
